// Files that may be compressed.
#pragma once

#include <filesystem>
#include <string>

namespace vemo {

// The content of a file, decompressed where the file was made by gzip. Throws SourceError where the file
// cannot be read, is cut off, or is damaged.
std::string ReadMaybeGzipFile(const std::filesystem::path& file);

}  // namespace vemo
