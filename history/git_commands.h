// The git commands that a history is read with.
#pragma once

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

namespace vemo {

// Each returns the arguments of one command, without "git" itself. Everything that the user's configuration
// could change in the output is given explicitly.

// Prints where `repository` lies inside its working tree: an empty line at its top and in a git folder.
std::vector<std::string> FindRepositoryCommand(const std::filesystem::path& repository);

// Prints the id of the commit that `revision` names; prints nothing where there is none.
std::vector<std::string> ResolveRevisionCommand(const std::filesystem::path& repository,
                                                std::string_view revision);

// Prints, each with a NUL behind it, the names of the settings that make a diff driver call files binary or
// text.
std::vector<std::string> ListBinarySettingsCommand(const std::filesystem::path& repository);

// Prints the first-parent history of `commit` in the form that GitLogParser reads. `binarySettings` are names
// from ListBinarySettingsCommand, which are put back to their default.
std::vector<std::string> LogCommand(const std::filesystem::path& repository,
                                    const std::vector<std::string>& binarySettings, std::string_view commit);

// Prints how many commits that history has.
std::vector<std::string> CountCommitsCommand(const std::filesystem::path& repository, std::string_view commit);

// Prints the files of `commit`, each as "MODE TYPE ID", a tab, the path and a NUL.
std::vector<std::string> ListFilesCommand(const std::filesystem::path& repository, std::string_view commit);

// Prints the blobs whose ids it reads, one on a line, each as "ID blob SIZE", a line feed, the content and a
// line feed.
std::vector<std::string> ReadBlobsCommand(const std::filesystem::path& repository);

}  // namespace vemo
