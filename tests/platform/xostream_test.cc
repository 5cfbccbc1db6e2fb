#include "platform/xostream.h"

#include <gtest/gtest.h>

#include <limits>
#include <sstream>
#include <string_view>

namespace vemo {
namespace {

class TextStream : public testing::Test {
 protected:
  std::ostringstream out;
  xostream os{out};
};

TEST_F(TextStream, WritesCharactersStringsAndNumbers) {
  os << 'a' << "bc" << std::string_view("de") << std::int64_t{0} << ' ' << std::int64_t{-12};
  EXPECT_EQ(out.str(), "abcde0 -12");
}

TEST_F(TextStream, WritesTheLargestNumbersInDecimal) {
  os << std::numeric_limits<std::int64_t>::min() << ' ' << std::numeric_limits<std::int64_t>::max();
  EXPECT_EQ(out.str(), "-9223372036854775808 9223372036854775807");
}

TEST_F(TextStream, WritesAnEmptyStringAsNothing) {
  const Indenter indent(os, 2);
  os << "";
  EXPECT_EQ(out.str(), "");
}

TEST_F(TextStream, IndentsEveryLineInsideAnIndenter) {
  os << "{\n";
  {
    const Indenter indent(os, 2);
    os << "a\nb" << 'c' << '\n';
    {
      const Indenter further(os, 3);
      os << std::int64_t{5} << "\n";
    }
    os << "d\n";
  }
  os << "}\n";
  EXPECT_EQ(out.str(), "{\n  a\n  bc\n     5\n  d\n}\n");
}

TEST_F(TextStream, LeavesEmptyLinesEmpty) {
  const Indenter indent(os, 2);
  os << "a\n\n\nb" << '\n' << '\n';
  EXPECT_EQ(out.str(), "  a\n\n\n  b\n\n");
}

TEST_F(TextStream, IndentsFromTheNextLineOnWhenALineHasBegun) {
  os << "a";
  const Indenter indent(os, 2);
  os << "b\nc";
  EXPECT_EQ(out.str(), "ab\n  c");
}

TEST_F(TextStream, LeavesErrorsToTheOwnerOfTheStreamBelow) {
  out.setstate(std::ios::badbit);
  os << "a";
  EXPECT_TRUE(out.bad());
  EXPECT_EQ(out.str(), "");
}

}  // namespace
}  // namespace vemo
