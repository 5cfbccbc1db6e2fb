#include "history/utf8.h"

#include <gtest/gtest.h>

#include "platform/error.h"

namespace vemo {
namespace {

using namespace std::string_view_literals;

std::vector<std::string_view> Split(std::string_view text) {
  std::vector<std::string_view> codePoints = {"left over"};
  SplitCodePoints(text, codePoints);
  return codePoints;
}

TEST(Utf8, SplitsTextIntoCodePointsOfEveryLength) {
  const std::vector<std::string_view> expected = {"a",      "\0"sv,       "\x7f",      "\u0080",
                                                  "\u07ff", "\u0800",     "\ud7ff",    "\ue000",
                                                  "\uffff", "\U00010000", "\U0010ffff"};
  std::string text;
  for (const std::string_view codePoint : expected) text += codePoint;
  EXPECT_EQ(Split(text), expected);
  EXPECT_EQ(CountCodePoints(text), expected.size());
}

TEST(Utf8, KeepsCombiningCharactersApart) {
  EXPECT_EQ(Split("e\u0301"), (std::vector<std::string_view>{"e", "\u0301"}));
}

TEST(Utf8, AnEmptyTextHasNoCodePoints) {
  EXPECT_TRUE(Split("").empty());
  EXPECT_EQ(CountCodePoints(""), 0u);
}

TEST(Utf8, RefusesWhatIsNotUtf8AndNamesTheOffset) {
  const std::string_view bad[] = {
      "ab\x80",              // a continuation byte alone
      "ab\xc3",              // cut off by the end
      "ab\xe2\x82",          //
      "ab\xf0\x9f\x98",      //
      "ab\xc3z",             // cut off by another character
      "ab\xe2\x82z",         //
      "ab\xc0\x80",          // longer than needed
      "ab\xc1\xbf",          //
      "ab\xe0\x9f\xbf",      //
      "ab\xf0\x8f\xbf\xbf",  //
      "ab\xed\xa0\x80",      // surrogates
      "ab\xed\xbf\xbf",      //
      "ab\xf4\x90\x80\x80",  // past U+10FFFF
      "ab\xf8\x88\x80\x80\x80",
      "ab\xff",
  };
  for (const std::string_view text : bad) {
    try {
      CountCodePoints(text);
      ADD_FAILURE() << "accepted: " << ::testing::PrintToString(text);
    } catch (const MalformedBytes& error) {
      EXPECT_EQ(error.offset(), 2u) << ::testing::PrintToString(text);
    }
    EXPECT_THROW(Split(text), MalformedBytes);
  }
}

}  // namespace
}  // namespace vemo
