// Git repositories made by the tests.
#pragma once

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "temporary_folder.h"

namespace vemo::test {

// A repository with a working tree in a folder of its own. Dates are fixed, so that commit ids are the same
// in every run. While it exists, HOME is an empty folder of its own for every process of the test: the
// configuration of whoever runs the test does not matter, and a test can write its own.
class TestRepository {
 public:
  TestRepository();
  ~TestRepository();

  std::filesystem::path path() const { return m_folder.path() / "repository"; }
  std::filesystem::path folder() const { return m_folder.path(); }

  // Runs git in the repository; throws where it fails. Returns its output without the last line feed.
  std::string Git(const std::vector<std::string>& arguments);

  void Write(const std::string& name, std::string_view content) { WriteFile(path() / name, content); }
  void Remove(const std::string& name) { std::filesystem::remove_all(path() / name); }
  // Commits the whole working tree, perhaps without a change, and returns the id.
  std::string Commit();
  // Commits what the index holds.
  std::string CommitIndex();
  void SetAuthor(std::string name, std::string address);
  // Appends to the user's configuration.
  void ConfigureUser(std::string_view text);

 private:
  TemporaryFolder m_folder;
  std::string m_outerHome;
  std::string m_author = "Ada Lovelace";
  std::string m_address = "ada@example.org";
  int m_seconds = 1500000000;
};

}  // namespace vemo::test
