#include "history/git_quoting.h"

#include <optional>

#include "history/source_error.h"

namespace vemo {

namespace {

bool IsOctal(char c) {
  return '0' <= c && c <= '7';
}

// The byte that a backslash and `c` stand for.
std::optional<char> Escaped(char c) {
  constexpr std::string_view kLetters = "abtnvfr\"\\";
  constexpr std::string_view kMeanings = "\a\b\t\n\v\f\r\"\\";
  const std::size_t at = kLetters.find(c);
  if (at == std::string_view::npos) return std::nullopt;
  return kMeanings[at];
}

// Reads the escape behind a backslash and removes it from the front of `text`.
std::optional<char> TakeEscape(std::string_view& text) {
  if (text.size() >= 3 && text[0] <= '3' && IsOctal(text[0]) && IsOctal(text[1]) && IsOctal(text[2])) {
    const int byte = (text[0] - '0') * 64 + (text[1] - '0') * 8 + (text[2] - '0');
    text.remove_prefix(3);
    return static_cast<char>(byte);
  }
  if (text.empty()) return std::nullopt;
  const std::optional<char> byte = Escaped(text.front());
  text.remove_prefix(1);
  return byte;
}

// Reads a quoted string and removes it from the front of `text`.
std::optional<std::string> TakeQuoted(std::string_view& text) {
  if (!text.starts_with('"')) return std::nullopt;
  text.remove_prefix(1);
  std::string value;
  while (!text.empty()) {
    const char c = text.front();
    text.remove_prefix(1);
    if (c == '"') return value;
    if (c != '\\') {
      value.push_back(c);
      continue;
    }
    const std::optional<char> escaped = TakeEscape(text);
    if (!escaped) return std::nullopt;
    value.push_back(*escaped);
  }
  return std::nullopt;
}

}  // namespace

std::string PathOfDiffLine(std::string_view paths) {
  std::optional<std::string> before, after;
  std::string_view rest = paths;
  if (paths.starts_with('"')) {
    before = TakeQuoted(rest);
    if (rest.starts_with(' ')) rest.remove_prefix(1);
    after = TakeQuoted(rest);
  } else if (paths.size() % 2 == 1 && paths[paths.size() / 2] == ' ') {
    // Both sides are equally long, so a space in the path cannot be mistaken for the one between them.
    before = std::string(paths.substr(0, paths.size() / 2));
    after = std::string(paths.substr(paths.size() / 2 + 1));
    rest = {};
  }
  if (!before || !after || !rest.empty() || !before->starts_with("a/") || !after->starts_with("b/") ||
      before->compare(2, std::string::npos, *after, 2, std::string::npos) != 0) {
    throw SourceError("git printed paths that cannot be understood: " + std::string(paths));
  }
  return before->substr(2);
}

}  // namespace vemo
