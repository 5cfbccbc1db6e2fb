// Whether data.mdb is known to be on the disk as it is.
//
// A commit in the log is lost with the one that it goes behind, so that one must be on the disk first. LMDB syncs what it commits,
// but another process may not have had it do so, and where a commit of LMDB fails, what LMDB writes to take it back is not synced
// either. Each of these leaves other meta pages: what is known is known of them and of all that lies below.
//
// Not to be called by two threads at once, nor while another process commits.
#pragma once

#include <array>
#include <functional>
#include <memory>
#include <optional>

#include "engines/lmdb/page_file.h"
#include "engines/lmdb/space_state.h"

namespace vemo {

class SyncedData {
 public:
  // Of `file` nothing is known yet.
  explicit SyncedData(std::shared_ptr<PageFile> file);

  // Whether it has been on the disk as it is now. Costs a look at the meta pages.
  bool IsOnDisk() const noexcept;
  // Calls `sync`, which brings it there or throws, unless it is there.
  void Require(const std::function<void()>& sync);

  // LMDB has made a commit and synced it.
  void Remember() noexcept { m_onDisk = Current(); }

 private:
  using MetaPages = std::array<MetaPage, kMetaPages>;

  MetaPages Current() const noexcept;
  bool IsOnDisk(const MetaPages& pages) const noexcept;

  const std::shared_ptr<PageFile> m_file;
  std::optional<MetaPages> m_onDisk;  // those that are known to be, with all below
};

}  // namespace vemo
