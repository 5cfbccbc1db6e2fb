// Histories that git has never seen, with everything that makes a diff ambiguous.
#pragma once

#include <cstdint>
#include <map>
#include <random>
#include <string>
#include <vector>

#include "platform/types.h"

namespace vemo::test {

// A branch "main" of a few files and authors: lines that come again and again, moved and repeated blocks,
// files that are rewritten, deleted, made again and renamed, last lines without a line feed, merges of side
// branches whose result is neither parent's. The same seed gives the same commits, with the same ids.
class RandomGitHistory {
 public:
  explicit RandomGitHistory(std::uint64_t seed) : m_random(seed) {}

  // One more commit of main, perhaps a merge of some commits aside.
  void AddCommit();
  // One more commit of main, which renames the longest file and does nothing else.
  void AddRename();

  // The history so far as `git fast-import` reads it.
  const std::string& Stream() const noexcept { return m_stream; }

 private:
  struct File {
    std::vector<std::string> lines;
    bool endsWithLineFeed = true;
  };
  using Tree = std::map<std::string, File>;

  std::size_t Below(std::size_t n) { return m_random() % n; }
  bool OneIn(std::size_t n) { return Below(n) == 0; }
  std::string RandomLine();
  std::vector<std::string> RandomLines(std::size_t most);
  std::string NewPath();

  void ChangeTree(Tree& tree);
  void ChangeFile(File& file);
  File Mix(const File& ours, const File& theirs);
  Tree Merge(const Tree& ours, const Tree& theirs);
  int Emit(const std::string& branch, const Tree& tree, int parent, int otherParent);

  std::mt19937_64 m_random;
  std::string m_stream;
  Tree m_main;
  int m_mainMark = 0;  // of the last commit of main; 0: none yet
  int m_lastMark = 0;
  int m_lastPath = 0;
  std::vector<std::string> m_pathsOnce;  // every path that there ever was
};

}  // namespace vemo::test
