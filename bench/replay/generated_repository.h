// A git repository made up for the benchmark.
#pragma once

#include <cstddef>
#include <filesystem>

namespace vemo::bench {

// Makes a bare repository in `folder`, which does not exist yet: sixty files of lines, of which each commit
// changes four in three places each, by five authors. The same number of commits makes the same repository.
// Throws std::runtime_error where git fails.
void MakeRepository(const std::filesystem::path& folder, std::size_t commits);

}  // namespace vemo::bench
