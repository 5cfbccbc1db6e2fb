// The first data.mdb of a space.
#pragma once

#include <filesystem>
#include <string>

namespace vemo {

// Puts a data.mdb without a commit into the folder, unless another process does at the same time. It is made and synced under
// another name, so that a loss of power leaves all of it or none. Throws LmdbError.
void MakeEmptyData(const std::filesystem::path& folder, const std::string& space);

}  // namespace vemo
