#include "bench/replay/generated_repository.h"

#include <fmt/core.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

namespace vemo::bench {

namespace {

using Lines = std::vector<std::string>;

constexpr std::size_t kFiles = 60;
constexpr std::size_t kFilesPerCommit = 4;
constexpr std::size_t kPlacesPerFile = 3;

class Generator {
 public:
  explicit Generator(std::FILE* out) : m_out(out) {}

  void EmitCommit(std::size_t number) {
    const std::string author = fmt::format("Author {0} <author{0}@example.org> {1} +0000", m_random() % 5,
                                           1'500'000'000 + number * 600);
    Emit(fmt::format("commit refs/heads/main\nauthor {0}\ncommitter {0}\ndata 6\nchange\n", author));
    for (std::size_t i = 0; i < kFilesPerCommit; ++i) {
      const std::size_t file = (number * kFilesPerCommit + i * 7 + m_random() % 3) % kFiles;
      for (std::size_t place = 0; place < kPlacesPerFile; ++place) ChangeOnePlace(m_files[file]);
      std::string content;
      for (const std::string& line : m_files[file]) content += line;
      Emit(fmt::format("M 100644 inline src/file{}.txt\ndata {}\n{}\n", file, content.size(), content));
    }
  }

 private:
  // Up to nine lines go and up to twelve come, so that a file grows to a few hundred and stays there.
  void ChangeOnePlace(Lines& lines) {
    const std::size_t at = m_random() % (lines.size() + 1);
    const std::size_t gone =
        std::min<std::size_t>(m_random() % (lines.size() > 400 ? 25 : 10), lines.size() - at);
    lines.erase(Place(lines, at), Place(lines, at + gone));
    Lines inserted;
    for (std::size_t count = 1 + m_random() % 12; count > 0; --count)
      inserted.push_back(fmt::format("line {} of text {:x}\n", m_random() % 1'000, m_random()));
    lines.insert(Place(lines, at), inserted.begin(), inserted.end());
  }

  static Lines::iterator Place(Lines& lines, std::size_t at) {
    return lines.begin() + static_cast<std::ptrdiff_t>(at);
  }

  void Emit(const std::string& text) {
    if (std::fwrite(text.data(), 1, text.size(), m_out) != text.size())
      throw std::runtime_error("git fast-import does not take its input");
  }

  std::FILE* m_out;
  std::mt19937_64 m_random{20'260'314};
  std::array<Lines, kFiles> m_files;
};

}  // namespace

void MakeRepository(const std::filesystem::path& folder, std::size_t commits) {
  const std::string git = "git -C '" + folder.string() + "' ";
  std::filesystem::create_directory(folder);
  if (std::system((git + "init --quiet --bare --initial-branch=main").c_str()) != 0)
    throw std::runtime_error("git init failed");
  std::FILE* out = ::popen((git + "fast-import --quiet").c_str(), "w");
  if (out == nullptr) throw std::runtime_error("git fast-import does not start");
  Generator generator(out);
  for (std::size_t i = 0; i < commits; ++i) generator.EmitCommit(i);
  if (::pclose(out) != 0) throw std::runtime_error("git fast-import failed");
}

}  // namespace vemo::bench
