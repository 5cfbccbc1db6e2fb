// A folder for one campaign, removed with everything in it: in memory where the machine has a file system there, since what
// campaigns ask of a file system is what it keeps, not how fast it is.
#pragma once

#include <stdlib.h>

#include <cerrno>
#include <filesystem>
#include <string>
#include <system_error>

namespace vemo::campaign {

class ScratchFolder {
 public:
  ScratchFolder() {
    const std::filesystem::path memory = "/dev/shm";
    if (!Make(memory) && !Make(std::filesystem::temp_directory_path())) {
      throw std::system_error(errno, std::generic_category(), "a folder for the campaign");
    }
  }
  ~ScratchFolder() {
    std::error_code ignored;  // what is left lies in a folder for what is temporary
    std::filesystem::remove_all(m_path, ignored);
  }
  ScratchFolder(const ScratchFolder&) = delete;
  ScratchFolder& operator=(const ScratchFolder&) = delete;

  const std::filesystem::path& path() const noexcept { return m_path; }

 private:
  bool Make(const std::filesystem::path& parent) {
    std::string name = (parent / "vemo-campaign-XXXXXX").string();
    if (::mkdtemp(name.data()) == nullptr) return false;
    m_path = name;
    return true;
  }

  std::filesystem::path m_path;
};

}  // namespace vemo::campaign
