// The pages of LMDB 0.9 on a 64-bit little-endian machine, as they lie in data.mdb.
//
//   page header, 16 bytes    number (8) | pad (2) | flags (2) | lower (2) | upper (2); of an overflow page the last
//                            four bytes are the number of pages in its run
//   branch and leaf pages    after the header an array of 2-byte node offsets that ends at `lower`, ordered by key; the
//                            nodes fill the page from `upper` to its end, in any order, each padded to an even size
//   node header, 8 bytes     lo (2) | hi (2) | flags (2) | key size (2), then the key, then the value.
//                            Leaf: lo and hi are the size of the value; one that is too large for the page is the number
//                            (8) of the first page of an overflow run. Branch: lo, hi and flags are the number of the
//                            child; the key of node 0 counts for nothing.
//   overflow run             pages in a row; the value follows the header of the first
//   meta pages 0 and 1       after the header what MetaPage has; commit n writes page n & 1
//
// The table of free pages has transactions as keys (8-byte numbers) and as values lists of numbers: a count, then page
// numbers in descending order; room may follow. The main table has the other tables' roots as values.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace vemo {

using PageNumber = std::uint64_t;

inline constexpr PageNumber kNoPage = ~PageNumber{0};  // the root of an empty table
inline constexpr PageNumber kMetaPages = 2;
inline constexpr std::size_t kPageHeaderBytes = 16;
inline constexpr std::size_t kNodeHeaderBytes = 8;
inline constexpr std::size_t kMinPageBytes = 512;
inline constexpr std::size_t kMaxPageBytes = 32768;
inline constexpr std::size_t kMaxKeyBytes = 511;
inline constexpr unsigned kMaxDepth = 32;

inline constexpr std::uint16_t kBranchPage = 0x01;
inline constexpr std::uint16_t kLeafPage = 0x02;
inline constexpr std::uint16_t kOverflowPage = 0x04;
inline constexpr std::uint16_t kMetaPageFlag = 0x08;

inline constexpr std::uint16_t kBigValue = 0x01;  // the value lies in an overflow run
inline constexpr std::uint16_t kSubTable = 0x02;  // the value is the root of a table

inline constexpr std::uint16_t kNumberKeys = 0x08;  // a table's flag: keys are numbers of the machine

inline constexpr std::uint32_t kLmdbMagic = 0xBEEFC0DE;
inline constexpr std::uint32_t kLmdbVersion = 1;

// The root of a table, as it stands in the main table and in the meta pages.
struct TableRoot {
  std::uint32_t pageBytes;  // in the meta pages' first root alone
  std::uint16_t flags;
  std::uint16_t depth;
  std::uint64_t branchPages;
  std::uint64_t leafPages;
  std::uint64_t overflowPages;
  std::uint64_t entries;
  PageNumber root;
};
static_assert(sizeof(TableRoot) == 48);

struct MetaPage {
  std::uint32_t magic;
  std::uint32_t version;
  std::uint64_t address;
  std::uint64_t mapBytes;
  TableRoot freePages;
  TableRoot main;
  PageNumber lastPage;
  std::uint64_t transaction;
};
static_assert(sizeof(MetaPage) == 136);

template <typename T>
T LoadAs(const void* from) noexcept {
  T value;
  std::memcpy(&value, from, sizeof value);
  return value;
}

// A node of a page whose nodes were found to lie within it.
class NodeView {
 public:
  explicit NodeView(const std::uint8_t* node) noexcept : m_node(node) {}
  std::uint16_t flags() const noexcept { return LoadAs<std::uint16_t>(m_node + 4); }
  std::size_t keyBytes() const noexcept { return LoadAs<std::uint16_t>(m_node + 6); }
  std::string_view key() const noexcept {
    return {reinterpret_cast<const char*>(m_node + kNodeHeaderBytes), keyBytes()};
  }
  PageNumber child() const noexcept { return LoadAs<std::uint64_t>(m_node) & 0xFFFF'FFFF'FFFF; }
  bool hasBigValue() const noexcept { return (flags() & kBigValue) != 0; }
  std::size_t valueBytes() const noexcept { return LoadAs<std::uint32_t>(m_node); }
  const std::uint8_t* value() const noexcept { return m_node + kNodeHeaderBytes + keyBytes(); }
  PageNumber bigValuePage() const noexcept { return LoadAs<std::uint64_t>(value()); }

  // What the node takes in a page.
  std::size_t bytes(bool inLeaf) const noexcept {
    std::size_t bytes = kNodeHeaderBytes + keyBytes();
    if (inLeaf) bytes += hasBigValue() ? sizeof(PageNumber) : valueBytes();
    return bytes + (bytes & 1);
  }

 private:
  const std::uint8_t* m_node;
};

class PageView {
 public:
  PageView() = default;
  explicit PageView(const std::uint8_t* page) noexcept : m_page(page) {}
  const std::uint8_t* data() const noexcept { return m_page; }
  PageNumber number() const noexcept { return LoadAs<std::uint64_t>(m_page); }
  std::uint16_t flags() const noexcept { return LoadAs<std::uint16_t>(m_page + 10); }
  bool isLeaf() const noexcept { return (flags() & kLeafPage) != 0; }
  std::size_t lower() const noexcept { return LoadAs<std::uint16_t>(m_page + 12); }
  std::size_t upper() const noexcept { return LoadAs<std::uint16_t>(m_page + 14); }
  std::uint32_t runPages() const noexcept { return LoadAs<std::uint32_t>(m_page + 12); }
  std::size_t count() const noexcept { return (lower() - kPageHeaderBytes) / 2; }
  std::size_t offset(std::size_t i) const noexcept {
    return LoadAs<std::uint16_t>(m_page + kPageHeaderBytes + 2 * i);
  }
  NodeView node(std::size_t i) const noexcept { return NodeView(m_page + offset(i)); }

 private:
  const std::uint8_t* m_page = nullptr;
};

// The pages that a value of `bytes` takes as an overflow run.
inline std::uint64_t RunPages(std::size_t bytes, std::size_t pageBytes) noexcept {
  return (kPageHeaderBytes + bytes + pageBytes - 1) / pageBytes;
}

}  // namespace vemo
