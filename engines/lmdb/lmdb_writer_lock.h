// The writer lock of a space across processes.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <filesystem>
#include <string>

#include "store/engine.h"

namespace vemo {

// An flock on a file of its own descriptor, which the system releases when the process dies, however it does.
// The file holds the process id of the holder in decimal, for messages only.
class LmdbWriterLock final : public WriterLock {
 public:
  // Waits up to `timeout`, trying every few milliseconds; throws SpaceBusy then, StoreError when the file
  // cannot be made.
  LmdbWriterLock(const std::filesystem::path& folder, const std::string& space,
                 std::chrono::milliseconds timeout);
  ~LmdbWriterLock() override;
  LmdbWriterLock(const LmdbWriterLock&) = delete;
  LmdbWriterLock& operator=(const LmdbWriterLock&) = delete;

 private:
  void Acquire(const std::string& space, std::chrono::milliseconds timeout);

  int m_file = -1;
  pid_t m_process;
};

}  // namespace vemo
