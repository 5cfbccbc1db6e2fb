// What a commit of LMDB says of itself: its meta page, the roots of its tables, its free pages.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "engines/lmdb/page_reader.h"

namespace vemo {

// Never changes once it is made, and may be shared among threads.
struct SpaceState {
  MetaPage meta{};
  std::size_t pageBytes = 0;
  PageTable freeTable;
  PageTable main;
  std::vector<PageTable> tables;  // the entries of the main table that are tables, in the order of their names
  bool hasOtherEntries = false;   // the main table holds what no space of ours does
  std::uint64_t rootsDigest = 0;  // of the meta page and of the main table
  std::shared_ptr<const PageSet> free;  // null where the list is damaged
  std::uint64_t freeDigest = 0;         // of the list as it is stored
  std::string freeFault;                // why there is none

  std::uint64_t transaction() const noexcept { return meta.transaction; }
  const PageTable* Table(std::string_view name) const noexcept;
};

// What is wrong with the parts of the meta pages that never change; empty for sound ones. `isForeign` tells whether the
// file is not LMDB's at all, or what is left of a creation that a power loss cut off, as far as that can be seen.
struct HeaderFault {
  std::string fault;
  bool isForeign = false;
};
HeaderFault FaultOfHeader(PageFile& file);

// The meta page of `transaction`, or nothing when it is not there (any more).
std::optional<MetaPage> ReadMeta(PageFile& file, std::uint64_t transaction);
// Meta page `index` (0 or 1) as it is, once no writer is in the middle of it.
MetaPage ReadMetaPage(PageFile& file, std::uint64_t index, std::size_t pageBytes);
// The page size of a file whose header is sound.
std::size_t PageBytesOf(PageFile& file);

// Reads main table and free pages below a meta page that is kept by a transaction. Throws DamagedStorage; a damaged list
// of free pages is no reason not to read, and is told in the state.
std::shared_ptr<const SpaceState> ReadState(const std::shared_ptr<PageFile>& file, const MetaPage& meta,
                                            const std::string& space);

// A reader of the commit's pages.
PageReader MakeReader(const std::shared_ptr<PageFile>& file, const SpaceState& state, const std::string& space);

}  // namespace vemo
