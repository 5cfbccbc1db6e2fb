#include "history/gzip_file.h"

#include <zlib.h>

#include <cerrno>
#include <cstring>
#include <memory>

#include "history/source_error.h"

namespace vemo {

namespace {

constexpr unsigned kBlockBytes = 1 << 20;

struct CloseGzip {
  void operator()(gzFile file) const noexcept { gzclose_r(file); }
};
using GzipFile = std::unique_ptr<gzFile_s, CloseGzip>;

[[noreturn]] void ThrowUnreadable(const std::filesystem::path& file, std::string_view reason) {
  throw SourceError("cannot read " + file.string() + ": " + std::string(reason));
}

// Throws where reading went wrong. An end that came too early shows here only, zlib returns what it has
// before.
void CheckGood(const std::filesystem::path& path, gzFile file) {
  int error = Z_OK;
  const char* message = gzerror(file, &error);
  if (error == Z_OK || error == Z_STREAM_END) return;
  if (error == Z_ERRNO) ThrowUnreadable(path, std::strerror(errno));
  if (error == Z_BUF_ERROR) ThrowUnreadable(path, "the compressed file is cut off");
  ThrowUnreadable(path, std::string("the compressed file is damaged: ") + message);
}

}  // namespace

std::string ReadMaybeGzipFile(const std::filesystem::path& file) {
  errno = 0;
  const GzipFile input(gzopen(file.c_str(), "rbe"));  // e: not inherited by other processes
  if (!input) ThrowUnreadable(file, std::strerror(errno != 0 ? errno : ENOMEM));
  gzbuffer(input.get(), kBlockBytes);
  std::string content;
  for (;;) {
    const std::size_t size = content.size();
    content.resize(size + kBlockBytes);
    const int got = gzread(input.get(), content.data() + size, kBlockBytes);
    if (got <= 0) {
      CheckGood(file, input.get());
      content.resize(size);
      return content;
    }
    content.resize(size + static_cast<std::size_t>(got));
  }
}

}  // namespace vemo
