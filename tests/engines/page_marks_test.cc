// What is remembered of the pages that were checked, by one thread or by several.
#include "engines/lmdb/page_marks.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

namespace vemo::test {
namespace {

constexpr int kThreads = 4;

TEST(PageMarks, APageKeepsThePlaceFromWhichItWasReachedFirst) {
  constexpr PageNumber kLast = 5'000;
  PageMarks marks(kLast);
  for (const PageNumber page : {PageNumber{0}, PageNumber{511}, PageNumber{512}, kLast}) {
    EXPECT_EQ(marks.Of(page), 0u);
    EXPECT_TRUE(marks.Set(page, page + 7));
    EXPECT_TRUE(marks.Set(page, page + 7));
    EXPECT_FALSE(marks.Set(page, page + 8));
    EXPECT_EQ(marks.Of(page), page + 7);
  }
  EXPECT_EQ(marks.Of(1), 0u);
}

TEST(PageMarks, OfThreadsThatReachAPageFromDifferentPlacesAllButOneAreTold) {
  constexpr PageNumber kPages = 3'000;
  PageMarks marks(kPages - 1);
  std::vector<std::atomic<int>> accepted(kPages);
  std::vector<std::thread> threads;
  for (int thread = 1; thread <= kThreads; ++thread) {
    threads.emplace_back([&, place = static_cast<std::uint64_t>(thread)] {
      for (PageNumber page = 0; page < kPages; ++page) {
        if (marks.Set(page, place)) {
          ++accepted[page];
          EXPECT_EQ(marks.Of(page), place);
        } else {
          EXPECT_NE(marks.Of(page), place);
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (PageNumber page = 0; page < kPages; ++page) EXPECT_EQ(accepted[page], 1) << page;
}

}  // namespace
}  // namespace vemo::test
