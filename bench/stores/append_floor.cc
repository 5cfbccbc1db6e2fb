#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <stdexcept>
#include <system_error>

#include "bench/stores/bytes_peer.h"

namespace vemo::bench {

namespace {

// What a durable commit costs at the least: the keys and payloads appended to a file, and fdatasync.
class AppendPeer : public BytesPeer {
 public:
  explicit AppendPeer(const StoreSetup& setup)
      : BytesPeer(setup),
        m_file(::open((setup.folder / "log").c_str(), O_CREAT | O_WRONLY | O_APPEND, 0644)) {
    if (m_file < 0) throw std::system_error(errno, std::generic_category(), "open");
  }
  ~AppendPeer() override { ::close(m_file); }
  AppendPeer(const AppendPeer&) = delete;
  AppendPeer& operator=(const AppendPeer&) = delete;

  void Begin() override { m_bytes.clear(); }
  void Commit() override {
    for (std::size_t written = 0; written < m_bytes.size();) {
      const ssize_t count = ::write(m_file, m_bytes.data() + written, m_bytes.size() - written);
      if (count < 0) throw std::system_error(errno, std::generic_category(), "write");
      written += static_cast<std::size_t>(count);
    }
    if (::fdatasync(m_file) != 0) throw std::system_error(errno, std::generic_category(), "fdatasync");
  }
  void StartReading() override { throw std::logic_error("a log is not read"); }
  std::uint64_t Scan() override { throw std::logic_error("a log is not read"); }

 protected:
  void PutBytes(std::string_view key, std::string_view payload) override {
    m_bytes.append(key).append(payload);
  }
  void EraseBytes(std::string_view key) override { m_bytes.append(key); }
  std::uint64_t FindBytes(std::string_view) override { throw std::logic_error("a log is not read"); }

 private:
  int m_file;
  std::string m_bytes;
};

}  // namespace

StoreKind AppendFloor() {
  return MakeStoreKind<AppendPeer>("append+fdatasync", StoreRole::kFloor, false);
}

}  // namespace vemo::bench
