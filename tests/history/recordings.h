// Where the recorded sessions lie: beside the source folder, or in VEMO_DATA_DIR.
#pragma once

#include <cstdlib>
#include <filesystem>

namespace vemo::test {

inline std::filesystem::path DataFolder() {
  const char* folder = std::getenv("VEMO_DATA_DIR");
  return folder != nullptr ? folder : VEMO_SOURCE_DIR "/../shared/data";
}

}  // namespace vemo::test
