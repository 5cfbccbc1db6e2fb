#include "bench/common/row_name.h"

#include <gtest/gtest.h>

namespace vemo::bench {
namespace {

TEST(RowName, HasWorkloadSizeAndPeer) {
  const std::optional<RowName> name = ParseRowName("map.insert.clustered.P1/1000000/absl::btree_map");
  ASSERT_TRUE(name);
  EXPECT_EQ(name->workload, "map.insert.clustered.P1");
  EXPECT_EQ(name->size, 1'000'000U);
  EXPECT_EQ(name->peer, "absl::btree_map");
}

TEST(RowName, IsRefusedWhereAPartIsMissingOrTheSizeIsNone) {
  for (const char* text :
       {"", "a", "a/1", "a//b", "a/x/b", "a/1x/b", "a/-1/b", "a/0/b", "a/99999999999999999999/b"})
    EXPECT_FALSE(ParseRowName(text)) << text;
}

}  // namespace
}  // namespace vemo::bench
