#include "store/uri.h"

#include <charconv>

#include "platform/error.h"

namespace vemo {

namespace {

[[noreturn]] void Refuse(std::string_view uri, const std::string& reason) {
  throw UsageError("\"" + std::string(uri) + "\" does not name a space: " + reason);
}

void ApplyOption(std::string_view uri, std::string_view option, SpaceUri& parsed) {
  const std::size_t equals = option.find('=');
  const std::string_view key = option.substr(0, equals);
  const std::string_view value = equals == std::string_view::npos ? "" : option.substr(equals + 1);
  const auto readBytes = [&](std::uint64_t& bytes) {
    const auto result = std::from_chars(value.data(), value.data() + value.size(), bytes);
    if (result.ec != std::errc() || result.ptr != value.data() + value.size() || bytes == 0) {
      Refuse(uri, std::string(key) + " wants a number of bytes");
    }
  };
  if (key == "map_bytes") {
    readBytes(parsed.mapBytes);
  } else if (key == "pending_bytes") {
    readBytes(parsed.pendingBytes);
  } else if (key == "sync") {
    if (value != "commit" && value != "none_risking_loss") Refuse(uri, "sync is commit or none_risking_loss");
    parsed.syncEachCommit = value == "commit";
  } else {
    Refuse(uri, "it has no option \"" + std::string(key) + "\" (map_bytes, pending_bytes and sync are known)");
  }
}

}  // namespace

SpaceUri ParseSpaceUri(std::string_view uri) {
  SpaceUri parsed;
  if (uri == "memory:") return parsed;
  constexpr std::string_view kLmdb = "lmdb:";
  if (!uri.starts_with(kLmdb)) Refuse(uri, "it should be lmdb:PATH or memory:");
  parsed.engine = SpaceUri::Engine::kLmdb;
  std::string_view rest = uri.substr(kLmdb.size());
  const std::size_t question = rest.find('?');
  parsed.path = std::string(rest.substr(0, question));
  if (parsed.path.empty()) Refuse(uri, "the path is missing");
  if (question == std::string_view::npos) return parsed;
  std::string_view options = rest.substr(question + 1);
  while (true) {
    const std::size_t ampersand = options.find('&');
    ApplyOption(uri, options.substr(0, ampersand), parsed);
    if (ampersand == std::string_view::npos) return parsed;
    options.remove_prefix(ampersand + 1);
  }
}

std::string SpaceUriText(const SpaceUri& uri) {
  if (uri.engine == SpaceUri::Engine::kMemory) return "memory:";
  std::string text = "lmdb:" + uri.path.string() + "?sync=" + (uri.syncEachCommit ? "commit" : "none_risking_loss");
  if (uri.mapBytes != 0) text += "&map_bytes=" + std::to_string(uri.mapBytes);
  if (uri.pendingBytes != 0) text += "&pending_bytes=" + std::to_string(uri.pendingBytes);
  return text;
}

}  // namespace vemo
