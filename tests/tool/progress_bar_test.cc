#include "tool/progress_bar.h"

#include <gtest/gtest.h>

#include <cstdlib>

#include "tool/numbers.h"

namespace vemo::test {
namespace {

using std::chrono::milliseconds;
using tool::ProgressBar;

// A terminal in memory and a clock that stands still until it is moved.
class ProgressBarTest : public ::testing::Test {
 protected:
  ProgressBarTest() : m_terminal(::open_memstream(&m_text, &m_size)) {}
  ~ProgressBarTest() override {
    std::fclose(m_terminal);
    std::free(m_text);
  }

  ProgressBar Bar(std::uint64_t total) {
    return ProgressBar("replaying", total, m_terminal,
                       [this] { return ProgressBar::Clock::time_point(m_time); });
  }
  // What was drawn since the last call.
  std::string Drawn() {
    std::fflush(m_terminal);
    const std::string drawn(m_text + m_read, m_size - m_read);
    m_read = m_size;
    return drawn;
  }

  milliseconds m_time{5'000};

 private:
  char* m_text = nullptr;
  std::size_t m_size = 0;
  std::size_t m_read = 0;
  std::FILE* m_terminal;
};

TEST_F(ProgressBarTest, StaysInvisibleInTheFirstSecond) {
  {
    ProgressBar bar = Bar(1'000);
    m_time += milliseconds(999);
    for (std::uint64_t done = 1; done <= 1'000; ++done) bar.Update(done);
  }
  EXPECT_EQ(Drawn(), "") << "and there is nothing to wipe";
}

TEST_F(ProgressBarTest, ShowsShareRateAndTimeLeft) {
  ProgressBar bar = Bar(400'000);
  m_time += milliseconds(1'000);
  bar.Update(1'000);
  EXPECT_EQ(Drawn(), "\r\033[Kreplaying   0% [                        ] 1,000/400,000  1,000/s  6:39 left");
  m_time += milliseconds(1'000);
  bar.Update(100'000);
  EXPECT_EQ(Drawn(),
            "\r\033[Kreplaying  25% [======                  ] 100,000/400,000  50,000/s  0:06 left");
}

TEST_F(ProgressBarTest, IsFullAtTheEnd) {
  ProgressBar bar = Bar(10);
  m_time += milliseconds(2'000);
  bar.Update(10);
  EXPECT_EQ(Drawn(), "\r\033[Kreplaying 100% [========================] 10/10  5/s  0:00 left");
}

TEST_F(ProgressBarTest, StaysFullWhereThereWasMoreThanExpected) {
  ProgressBar bar = Bar(10);
  m_time += milliseconds(2'000);
  bar.Update(20);
  EXPECT_EQ(Drawn(), "\r\033[Kreplaying 100% [========================] 20/10  10/s  0:00 left");
}

TEST_F(ProgressBarTest, DrawsATenthOfASecondApart) {
  ProgressBar bar = Bar(100);
  m_time += milliseconds(1'000);
  bar.Update(1);
  EXPECT_NE(Drawn(), "");
  m_time += milliseconds(99);
  bar.Update(2);
  EXPECT_EQ(Drawn(), "");
  m_time += milliseconds(1);
  bar.Update(3);
  EXPECT_NE(Drawn(), "");
}

TEST_F(ProgressBarTest, WipesItselfAtTheEnd) {
  {
    ProgressBar bar = Bar(100);
    m_time += milliseconds(1'000);
    bar.Update(1);
    Drawn();
  }
  EXPECT_EQ(Drawn(), "\r\033[K");
}

TEST_F(ProgressBarTest, LooksAtTheClockTwoThousandTimesAtMost) {
  int looks = 0;
  ProgressBar bar("replaying", 1'000'000, stderr, [&] {
    ++looks;
    return ProgressBar::Clock::time_point();
  });
  for (std::uint64_t done = 1; done <= 1'000'000; ++done) bar.Update(done);
  EXPECT_LE(looks, 2'001);
  EXPECT_GT(looks, 1'000);
}

TEST_F(ProgressBarTest, DoesNothingWithoutATerminal) {
  int looks = 0;
  {
    ProgressBar bar("replaying", 10, nullptr, [&] {
      ++looks;
      return ProgressBar::Clock::time_point(std::chrono::hours(looks));
    });
    bar.Update(10);
  }
  EXPECT_EQ(looks, 1) << "the start";
}

TEST(NumbersTest, AreGroupedByThousands) {
  EXPECT_EQ(tool::Grouped(0), "0");
  EXPECT_EQ(tool::Grouped(999), "999");
  EXPECT_EQ(tool::Grouped(1'000), "1,000");
  EXPECT_EQ(tool::Grouped(12'345'678), "12,345,678");
  EXPECT_EQ(tool::Grouped(UINT64_MAX), "18,446,744,073,709,551,615");
}

TEST(NumbersTest, OfBytesHaveUnits) {
  EXPECT_EQ(tool::ByteSize(0), "0 bytes");
  EXPECT_EQ(tool::ByteSize(1'023), "1023 bytes");
  EXPECT_EQ(tool::ByteSize(1'024), "1.0 KiB");
  EXPECT_EQ(tool::ByteSize(1'536), "1.5 KiB");
  EXPECT_EQ(tool::ByteSize(std::uint64_t(5) << 30), "5.0 GiB");
  EXPECT_EQ(tool::ByteSize(std::uint64_t(3) << 50), "3072.0 TiB");
}

}  // namespace
}  // namespace vemo::test
