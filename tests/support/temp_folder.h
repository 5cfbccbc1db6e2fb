// A folder for one test, removed with everything in it.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <cerrno>
#include <filesystem>
#include <string>
#include <system_error>

namespace vemo::test {

class TempFolder {
 public:
  TempFolder() {
    std::string name = (std::filesystem::path(testing::TempDir()) / "vemo-XXXXXX").string();
    if (::mkdtemp(name.data()) == nullptr) throw std::system_error(errno, std::generic_category(), name);
    m_path = name;
  }
  ~TempFolder() {
    std::error_code error;
    std::filesystem::remove_all(m_path, error);
    if (error) ADD_FAILURE() << "cannot remove " << m_path << ": " << error.message();
  }
  TempFolder(const TempFolder&) = delete;
  TempFolder& operator=(const TempFolder&) = delete;

  const std::filesystem::path& path() const noexcept { return m_path; }

 private:
  std::filesystem::path m_path;
};

}  // namespace vemo::test
