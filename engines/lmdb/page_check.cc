#include "engines/lmdb/page_check.h"

#include <array>

namespace vemo {
namespace {

// Where nodes begin; they begin at even offsets.
using NodeStarts = std::array<std::uint64_t, kMaxPageBytes / 2 / 64>;

const char* FaultOfNode(NodeView node, std::size_t room, const PageRole& role) noexcept {
  if (node.keyBytes() > room - kNodeHeaderBytes) return "a key reaches beyond the page";
  if (node.keyBytes() > kMaxKeyBytes) return "a key is longer than any can be";
  if (role.order == KeyOrder::kNumbers && role.isLeaf && node.keyBytes() != sizeof(std::uint64_t)) {
    return "a key is no number";
  }
  if (!role.isLeaf) return nullptr;
  const std::uint16_t flags = node.flags();
  const bool isTable = flags == kSubTable && role.mayHoldTables;
  if (flags != 0 && flags != kBigValue && !isTable) return "a node is of an unknown kind";
  if (isTable && node.valueBytes() != sizeof(TableRoot)) return "the root of a table has another size";
  if (node.keyBytes() == 0) return "a key is empty";
  if (node.bytes(true) > room) return "a value reaches beyond the page";
  return nullptr;
}

const char* FaultOfPacking(PageView page, std::size_t pageBytes, const PageRole& role) noexcept {
  NodeStarts starts;
  std::memset(starts.data(), 0, (pageBytes / 2 + 63) / 64 * sizeof starts[0]);
  const std::size_t count = page.count();
  for (std::size_t i = 0; i < count; ++i) {
    const std::size_t offset = page.offset(i);
    if (offset < page.upper() || offset % 2 != 0 || offset > pageBytes - kNodeHeaderBytes) {
      return "a node lies outside its part of the page";
    }
    if (const char* fault = FaultOfNode(page.node(i), pageBytes - offset, role)) return fault;
    starts[offset / 128] |= std::uint64_t{1} << (offset / 2 % 64);
  }
  std::size_t found = 0;
  std::size_t at = page.upper();
  for (; at < pageBytes; ++found) {
    if ((starts[at / 128] >> (at / 2 % 64) & 1) == 0) return "its nodes leave a gap or overlap";
    at += NodeView(page.data() + at).bytes(role.isLeaf);
  }
  return found == count && at == pageBytes ? nullptr : "its nodes leave a gap or overlap";
}

const char* FaultOfKeys(PageView page, const PageRole& role) noexcept {
  // The key of a branch page's first node counts for nothing: all that is less than the second hangs there.
  const std::size_t first = role.isLeaf ? 0 : 1;
  const std::size_t count = page.count();
  for (std::size_t i = first + 1; i < count; ++i) {
    if (!KeyLess(role.order, page.node(i - 1).key(), page.node(i).key())) return "its keys are out of order";
  }
  if (first >= count) return nullptr;
  const KeyBounds& bounds = role.bounds;
  if (bounds.from && KeyLess(role.order, page.node(first).key(), *bounds.from)) {
    return "its keys are less than the page above it allows";
  }
  if (bounds.before && !KeyLess(role.order, page.node(count - 1).key(), *bounds.before)) {
    return "its keys are greater than the page above it allows";
  }
  return nullptr;
}

}  // namespace

bool KeyLess(KeyOrder order, std::string_view a, std::string_view b) noexcept {
  if (order == KeyOrder::kBytes || a.size() != sizeof(std::uint64_t) || b.size() != sizeof(std::uint64_t)) return a < b;
  return LoadAs<std::uint64_t>(a.data()) < LoadAs<std::uint64_t>(b.data());
}

const char* FaultOfPage(PageView page, std::size_t pageBytes, const PageRole& role) noexcept {
  if (page.number() != role.number) return "it has the number of another page";
  if (page.flags() != (role.isLeaf ? kLeafPage : kBranchPage)) return "it is of another kind than should stand here";
  const std::size_t lower = page.lower();
  const std::size_t upper = page.upper();
  if (lower < kPageHeaderBytes || lower % 2 != 0 || upper < lower || upper % 2 != 0 || upper > pageBytes) {
    return "its bounds are not possible";
  }
  if (page.count() < role.leastNodes) return "it has too few nodes";
  if (const char* fault = FaultOfPacking(page, pageBytes, role)) return fault;
  return FaultOfKeys(page, role);
}

const char* FaultOfRun(PageView page, PageNumber number, std::size_t bytes, std::size_t pageBytes,
                       bool mayBeLonger) noexcept {
  if (page.number() != number) return "it has the number of another page";
  if (page.flags() != kOverflowPage) return "it is of another kind than should stand here";
  const std::uint64_t needed = RunPages(bytes, pageBytes);
  if (page.runPages() == needed || (mayBeLonger && page.runPages() > needed)) return nullptr;
  return "it holds a value of another size";
}

}  // namespace vemo
