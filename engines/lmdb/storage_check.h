// Checks every page of a commit.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "engines/lmdb/space_state.h"

namespace vemo {

struct StorageReport {
  std::vector<StorageFinding> findings;  // the first thousand; a last one counts the others
  std::uint64_t records = 0;             // in leaves that can be read
};

// Checks that each page from the first to the last is a sound page of one table, reached once, or free; that each value in
// a tagged table stands under its own key; that the tables are as large as their roots tell. A fault hides what lies below
// the page. Reads each page once, of the values only their first pages; takes two bits and 8 bytes a page.
StorageReport CheckPages(const std::shared_ptr<PageFile>& file, const SpaceState& state, const std::string& space);

}  // namespace vemo
