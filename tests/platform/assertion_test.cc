#include "platform/assertion.h"

#include <gtest/gtest.h>

#include "tests/support/assertion_death.h"

namespace vemo {
namespace {

void StopHere() {
  AssertionFailed("1 == 2", "file.cc", 12, "void F()");
}

TEST(Assertion, AFailureNamesFileLineFunctionAndConditionAndAborts) {
  EXPECT_EXIT(StopHere(), testing::KilledBySignal(SIGABRT),
              "^file.cc:12: void F\\(\\): assertion failed: 1 == 2\n$");
}

TEST(Assertion, TheConditionIsTheTextUnlessOneIsGiven) {
  [[maybe_unused]] const int n = 3;
  EXPECT_ASSERTION(VEMO_ASSERT(n < 3), "n < 3");
  EXPECT_ASSERTION(VEMO_ASSERT_TEXT(n < 3, "n<limit"), "n<limit");
}

TEST(Assertion, VerifyEvaluatesItsConditionOnceInEveryBuild) {
  int calls = 0;
  VEMO_VERIFY_TEXT(++calls > 0, "++calls > 0");
  EXPECT_EQ(calls, 1);
}

TEST(Assertion, AnAssertionEvaluatesItsConditionOnceOrNotAtAll) {
  int calls = 0;
  VEMO_ASSERT(++calls > 0);
#if defined(VEMO_NO_ASSERTIONS)
  EXPECT_EQ(calls, 0);
#else
  EXPECT_EQ(calls, 1);
#endif
}

}  // namespace
}  // namespace vemo
