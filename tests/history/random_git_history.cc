#include "random_git_history.h"

#include <algorithm>
#include <array>
#include <iterator>

namespace vemo::test {

namespace {

using Lines = std::vector<std::string>;

std::ptrdiff_t Offset(std::size_t n) {
  return static_cast<std::ptrdiff_t>(n);
}

void InsertAt(Lines& lines, std::size_t at, const Lines& added) {
  lines.insert(lines.begin() + Offset(at), added.begin(), added.end());
}

Lines TakeBlock(Lines& lines, std::size_t at, std::size_t n) {
  const auto first = lines.begin() + Offset(at);
  Lines block(first, first + Offset(n));
  lines.erase(first, first + Offset(n));
  return block;
}

}  // namespace

std::string RandomGitHistory::RandomLine() {
  constexpr std::array<const char*, 10> kCommon = {"{",
                                                   "}",
                                                   "",
                                                   "  }",
                                                   "  return;",
                                                   "\tif (x) {",
                                                   "# title",
                                                   "  x = 1;",
                                                   "-- a line like a header",
                                                   "@@ -1,2 +3,4 @@"};
  if (OneIn(3)) return "line " + std::to_string(Below(100'000));
  return kCommon[Below(kCommon.size())];
}

Lines RandomGitHistory::RandomLines(std::size_t most) {
  Lines lines(1 + Below(most));
  for (std::string& line : lines) line = RandomLine();
  return lines;
}

std::string RandomGitHistory::NewPath() {
  m_pathsOnce.push_back((OneIn(3) ? "folder/file" : "file") + std::to_string(++m_lastPath));
  return m_pathsOnce.back();
}

void RandomGitHistory::ChangeFile(File& file) {
  Lines& lines = file.lines;
  if (lines.empty() || OneIn(60)) lines = RandomLines(120);
  const std::size_t at = Below(lines.size());
  const std::size_t n = 1 + Below(std::min<std::size_t>(8, lines.size() - at));
  switch (Below(lines.size() > 250 ? 3 : 6)) {
    case 0:
      TakeBlock(lines, at, n);
      break;
    case 1: {
      const Lines moved = TakeBlock(lines, at, n);
      InsertAt(lines, Below(lines.size() + 1), moved);
      break;
    }
    case 2:
      TakeBlock(lines, at, n);
      InsertAt(lines, at, RandomLines(6));
      break;
    case 3: {
      const Lines copied(lines.begin() + Offset(at), lines.begin() + Offset(at + n));
      InsertAt(lines, at, copied);
      break;
    }
    default:
      InsertAt(lines, at, RandomLines(12));
  }
  if (OneIn(40)) std::shuffle(lines.begin(), lines.end(), m_random);
  if (OneIn(15)) file.endsWithLineFeed = !file.endsWithLineFeed;
}

void RandomGitHistory::ChangeTree(Tree& tree) {
  if (tree.size() < 4 || (tree.size() < 8 && OneIn(12))) {
    const bool again = !m_pathsOnce.empty() && OneIn(2);
    tree[again ? m_pathsOnce[Below(m_pathsOnce.size())] : NewPath()].lines = RandomLines(80);
  }
  for (std::size_t changes = 1 + Below(3); changes > 0; --changes) {
    ChangeFile(std::next(tree.begin(), Offset(Below(tree.size())))->second);
  }
  if (OneIn(25)) tree.erase(std::next(tree.begin(), Offset(Below(tree.size()))));
  if (tree.empty() || !OneIn(20)) return;
  auto renamed = tree.extract(std::next(tree.begin(), Offset(Below(tree.size()))));
  renamed.key() = NewPath();
  tree.insert(std::move(renamed));
}

// Some of each.
RandomGitHistory::File RandomGitHistory::Mix(const File& ours, const File& theirs) {
  File mixed = ours;
  Lines added = theirs.lines;
  if (added.empty()) return mixed;
  const std::size_t at = Below(added.size());
  InsertAt(mixed.lines, Below(mixed.lines.size() + 1),
           TakeBlock(added, at, std::min<std::size_t>(10, added.size() - at)));
  return mixed;
}

RandomGitHistory::Tree RandomGitHistory::Merge(const Tree& ours, const Tree& theirs) {
  Tree merged = ours;
  for (const auto& [path, file] : theirs) {
    const auto own = ours.find(path);
    if (own == ours.end() || OneIn(3)) {
      merged[path] = file;
    } else if (OneIn(2)) {
      merged[path] = Mix(own->second, file);
    }
  }
  for (const auto& [path, file] : ours) {
    if (!theirs.contains(path) && OneIn(2)) merged.erase(path);
  }
  return merged;
}

int RandomGitHistory::Emit(const std::string& branch, const Tree& tree, int parent, int otherParent) {
  constexpr std::array<const char*, 4> kAuthors = {"Ada Lovelace <ada@example.org>",
                                                   "Jörg Ötzi <joerg@example.org>",
                                                   "Grace <grace@example.org>", "A B C <abc@example.org>"};
  const std::string date = " " + std::to_string(1'500'000'000 + 60 * ++m_lastMark) + " +0000\n";
  m_stream += "commit refs/heads/" + branch + "\nmark :" + std::to_string(m_lastMark) + "\nauthor " +
              kAuthors[Below(kAuthors.size())] + date + "committer Committer <c@example.org>" + date +
              "data 0\n";
  if (parent != 0) m_stream += "from :" + std::to_string(parent) + "\n";
  if (otherParent != 0) m_stream += "merge :" + std::to_string(otherParent) + "\n";
  m_stream += "deleteall\n";
  for (const auto& [path, file] : tree) {
    std::string content;
    for (const std::string& line : file.lines) content += line + "\n";
    if (!file.endsWithLineFeed && !content.empty()) content.pop_back();
    m_stream +=
        "M 100644 inline " + path + "\ndata " + std::to_string(content.size()) + "\n" + content + "\n";
  }
  return m_lastMark;
}

void RandomGitHistory::AddCommit() {
  int sideMark = 0;
  if (m_mainMark != 0 && OneIn(10)) {
    Tree side = m_main;
    sideMark = m_mainMark;
    for (std::size_t commits = 1 + Below(4); commits > 0; --commits) {
      ChangeTree(side);
      sideMark = Emit("side", side, sideMark, 0);
    }
    ChangeTree(m_main);
    m_main = Merge(m_main, side);
  } else if (!OneIn(30)) {  // else a commit that changes nothing
    ChangeTree(m_main);
  }
  m_mainMark = Emit("main", m_main, m_mainMark, sideMark);
}

void RandomGitHistory::AddRename() {
  auto longest = std::max_element(m_main.begin(), m_main.end(), [](const auto& a, const auto& b) {
    return a.second.lines.size() < b.second.lines.size();
  });
  auto renamed = m_main.extract(longest);
  renamed.key() = NewPath();
  m_main.insert(std::move(renamed));
  m_mainMark = Emit("main", m_main, m_mainMark, 0);
}

}  // namespace vemo::test
