#include "history/site.h"

#include <gtest/gtest.h>

namespace vemo {
namespace {

// Sites are stored with the edits: another result for the same author would split the author in two.
TEST(Site, IsFixedForEachAuthor) {
  EXPECT_EQ(GuidText(SiteOfAuthor("Ada Lovelace <ada@example.org>")), "354f313c-94a6-5653-bdd4-77eedbdb513c");
  EXPECT_EQ(GuidText(SiteOfAuthor("")), "04d9e61e-bb62-52a8-a94b-05d1c63bb218");
}

TEST(Site, IsAVersion5Uuid) {
  for (const char* author : {"", "a", "b <b>", "\xff"}) {
    const auto bytes = GuidToNetworkBytes(SiteOfAuthor(author));
    EXPECT_EQ(bytes[6] >> 4, 5) << author;
    EXPECT_EQ(bytes[8] >> 6, 2) << author;
  }
}

TEST(Site, DiffersBetweenAuthors) {
  EXPECT_FALSE(SiteOfAuthor("a <a>") == SiteOfAuthor("a <b>"));
  EXPECT_FALSE(SiteOfAuthor("a <a>") == SiteOfAuthor("A <a>"));
  EXPECT_FALSE(SiteOfAuthor("a <a>") == SiteOfAuthor("a <a> "));
}

}  // namespace
}  // namespace vemo
