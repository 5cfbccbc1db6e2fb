// What can be seen of one page by itself and the two keys between which it hangs.
#pragma once

#include <optional>
#include <string_view>

#include "engines/lmdb/page_format.h"

namespace vemo {

// The keys of a page and of all below it are at least `from` and less than `before`; nothing: no bound.
struct KeyBounds {
  std::optional<std::string_view> from;
  std::optional<std::string_view> before;
};

enum class KeyOrder {
  kBytes,
  kNumbers,  // 8-byte numbers of the machine
};

bool KeyLess(KeyOrder order, std::string_view a, std::string_view b) noexcept;

// What is expected of a page.
struct PageRole {
  PageNumber number = 0;
  bool isLeaf = false;
  KeyOrder order = KeyOrder::kBytes;
  bool mayHoldTables = false;  // the leaf's values may be roots of tables
  std::size_t leastNodes = 1;
  KeyBounds bounds;
};

// What is wrong with the branch or leaf page at `page`, of which `pageBytes` may be read; null for a sound one: its own
// number and kind, nodes that fill it without a gap or an overlap, keys in order and within their bounds.
const char* FaultOfPage(PageView page, std::size_t pageBytes, const PageRole& role) noexcept;

// What is wrong with the head of an overflow run that holds a value of `bytes`; null for a sound one. A run of the table
// of free pages may be longer than its value needs.
const char* FaultOfRun(PageView page, PageNumber number, std::size_t bytes, std::size_t pageBytes,
                       bool mayBeLonger) noexcept;

}  // namespace vemo
