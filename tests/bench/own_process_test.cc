#include "bench/common/own_process.h"

#include <gtest/gtest.h>

#include <stdexcept>

namespace vemo::bench {
namespace {

TEST(OwnProcess, ReturnsWhatTheChildMeasured) {
  const std::vector<Measurement> found = RunInOwnProcess([]() -> std::vector<Measurement> {
    return {{"first", "ns/op", 1.5, 7}, {"second", "bytes/key", 0.25, ~std::uint64_t{0}}};
  });
  ASSERT_EQ(found.size(), 2U);
  EXPECT_EQ(found[0].row, "first");
  EXPECT_EQ(found[0].unit, "ns/op");
  EXPECT_EQ(found[0].value, 1.5);
  EXPECT_EQ(found[0].answers, 7U);
  EXPECT_EQ(found[1].row, "second");
  EXPECT_EQ(found[1].answers, ~std::uint64_t{0});
}

TEST(OwnProcess, LeavesNothingBehind) {
  int changed = 0;
  RunInOwnProcess([&changed]() -> std::vector<Measurement> {
    changed = 1;
    return {};
  });
  EXPECT_EQ(changed, 0);
}

TEST(OwnProcess, ThrowsWhenTheChildDoes) {
  EXPECT_THROW(
      RunInOwnProcess([]() -> std::vector<Measurement> { throw std::runtime_error("meant to fail"); }),
      std::runtime_error);
}

}  // namespace
}  // namespace vemo::bench
