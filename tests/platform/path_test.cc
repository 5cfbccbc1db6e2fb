#include "platform/path.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <new>
#include <numeric>
#include <utility>
#include <vector>

#include "tests/support/failing_allocator.h"

namespace vemo {
namespace {

Path PathOfLength(std::uint32_t size, Path::Element first = 0) {
  Path path;
  auto elements = path.Resize(size);
  std::iota(elements.begin(), elements.end(), first);
  return path;
}

std::vector<Path::Element> Elements(const Path& path) {
  return {path.elements().begin(), path.elements().end()};
}

// 3 steps lie inside the object, 4 do not.
const std::uint32_t kLengths[] = {0, 1, 3, 4, 5, 40};

TEST(Path, DefaultIsEmpty) {
  const Path path;
  EXPECT_TRUE(path.empty());
  EXPECT_EQ(path.size(), 0u);
  EXPECT_EQ(path, Path({}));
}

TEST(Path, HoldsTheStepsItWasMadeOf) {
  EXPECT_EQ(Elements(Path{0, 3}), (std::vector<Path::Element>{0, 3}));
  EXPECT_EQ(Elements(Path{1, 2, 3, 4, 5}), (std::vector<Path::Element>{1, 2, 3, 4, 5}));
  EXPECT_FALSE(Path{0}.empty());
}

TEST(Path, ACopyIsEqualAndIndependent) {
  for (const std::uint32_t n : kLengths) {
    const Path original = PathOfLength(n);
    Path copy = original;
    EXPECT_EQ(copy, original) << n;
    if (n == 0) continue;
    copy.Resize(n)[0] = 99;
    EXPECT_EQ(original, PathOfLength(n)) << n;
  }
}

TEST(Path, AssignmentReplacesAnyLengthByAnyOther) {
  for (const std::uint32_t from : kLengths) {
    for (const std::uint32_t to : kLengths) {
      Path target = PathOfLength(to, 100);
      target = PathOfLength(from);
      EXPECT_EQ(target, PathOfLength(from)) << from << " to " << to;

      Path copied = PathOfLength(to, 100);
      const Path source = PathOfLength(from);
      copied = source;
      EXPECT_EQ(copied, source) << from << " to " << to;
    }
  }
}

TEST(Path, AssigningAPathToItselfLeavesItUnchanged) {
  for (const std::uint32_t n : kLengths) {
    Path path = PathOfLength(n);
    Path& same = path;
    path = same;
    EXPECT_EQ(path, PathOfLength(n)) << n;
    path = std::move(same);
    EXPECT_EQ(path, PathOfLength(n)) << n;
  }
}

TEST(Path, MovingTakesTheStepsAndLeavesAnEmptyPath) {
  for (const std::uint32_t n : kLengths) {
    Path source = PathOfLength(n);
    const Path target = std::move(source);
    EXPECT_EQ(target, PathOfLength(n)) << n;
    EXPECT_TRUE(source.empty()) << n;
    source = Path{7};
    EXPECT_EQ(source, Path{7}) << n;
  }
}

TEST(Path, MovingAllocatesNothing) {
  Path source = PathOfLength(40);
  const test::FailingAllocation fail(1);
  Path target = std::move(source);
  Path& same = target;
  target = std::move(same);
  EXPECT_EQ(target.size(), 40u);
  EXPECT_FALSE(fail.HasFailed());
}

TEST(Path, IsOrderedStepByStepAndBeforeItsContinuations) {
  const std::vector<Path> ascending = {
      Path{},     Path{0}, Path{0, 0}, Path{0, 0, 0, 0}, Path{0, 0, 0, 0, 0}, Path{0, 0, 0, 0, 1},
      Path{0, 1}, Path{1}, Path{1, 0}, Path{2},          Path{0xFFFFFFFFu}};
  for (std::size_t i = 0; i < ascending.size(); ++i) {
    for (std::size_t j = 0; j < ascending.size(); ++j) {
      EXPECT_EQ(ascending[i] < ascending[j], i < j) << i << " " << j;
      EXPECT_EQ(ascending[i] == ascending[j], i == j) << i << " " << j;
    }
  }
}

TEST(Path, ACopyThatCannotBeAllocatedThrowsAndLeavesTheTargetAsItWas) {
  const Path source = PathOfLength(40);
  Path target = PathOfLength(5, 100);
  {
    const test::FailingAllocation fail(1);
    EXPECT_THROW(target = source, std::bad_alloc);
  }
  EXPECT_EQ(target, PathOfLength(5, 100));
  const test::FailingAllocation fail(1);
  EXPECT_THROW(Path copy(source), std::bad_alloc);
}

TEST(Path, FreesWhatItAllocated) {
  const auto before = test::LiveAllocations();
  {
    Path path = PathOfLength(5);
    path = PathOfLength(40);
    const Path copy = path;
    path = Path{1};
    path = copy;
  }
  EXPECT_EQ(test::LiveAllocations(), before);
}

// All paths of up to six steps of 0, 1 and the largest number, some of them shrunk from the heap, against the definition.
TEST(Path, OrdersAsTheSequencesOfItsSteps) {
  std::vector<std::vector<Path::Element>> sequences{{}};
  for (std::size_t i = 0; i < sequences.size() && sequences[i].size() < 6; ++i) {
    for (const Path::Element step : {0u, 1u, ~0u}) {
      if (sequences[i].size() >= 3 && step == 1) continue;
      sequences.push_back(sequences[i]);
      sequences.back().push_back(step);
    }
  }
  std::vector<Path> paths;
  for (const auto& sequence : sequences) {
    paths.emplace_back(sequence);
    if (sequence.size() % 2 == 0) continue;
    paths.back() = PathOfLength(8, 5);
    paths.back() = Path(sequence);
    if (sequence.size() == 3) {
      paths.back() = PathOfLength(7, 9);
      std::ranges::copy(sequence, paths.back().Resize(3).begin());
    }
  }
  for (std::size_t i = 0; i < paths.size(); ++i) {
    for (std::size_t j = 0; j < paths.size(); ++j) {
      const int expected = sequences[i] < sequences[j] ? -1 : sequences[i] == sequences[j] ? 0 : 1;
      ASSERT_EQ(Path::Compare(paths[i], paths[j]), expected) << i << " " << j;
      ASSERT_EQ(paths[i] < paths[j], expected < 0);
      ASSERT_EQ(paths[i] == paths[j], expected == 0);
    }
  }
}

TEST(Path, ResizingKeepsTheStepsThatFit) {
  for (const std::uint32_t from : kLengths) {
    for (const std::uint32_t to : kLengths) {
      Path path = PathOfLength(from, 7);
      path.Resize(to);
      for (std::uint32_t i = 0; i < std::min(from, to); ++i) EXPECT_EQ(path.elements()[i], 7 + i) << from << " to " << to;
    }
  }
}

TEST(Path, StepsThatWereCutOffDoNotCount) {
  Path path{1, 2, 3};
  path.Resize(1);
  EXPECT_EQ(path, Path{1});
  path.Resize(2)[1] = 0;
  EXPECT_EQ(path, (Path{1, 0}));
  Path source{4, 5};
  const Path taken = std::move(source);
  source.Resize(1)[0] = 4;
  EXPECT_EQ(source, Path{4});
  EXPECT_EQ(taken, (Path{4, 5}));
}

}  // namespace
}  // namespace vemo
