// What peers that store bytes have in common: the byte forms of keys and payloads.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "bench/stores/store_peer.h"

namespace vemo::bench {

// A key as bytes whose order, byte for byte, is that of the keys: the object id, then each step, in the
// prefix integers of the records.
class PackedKey {
 public:
  explicit PackedKey(const FieldId& key);
  const std::uint8_t* data() const { return m_bytes; }
  std::size_t size() const { return m_size; }
  std::string_view view() const { return {reinterpret_cast<const char*>(m_bytes), m_size}; }

 private:
  std::uint8_t m_bytes[64];
  std::size_t m_size;
};

// The number that StorePeer::Find makes of a payload, read from its byte form in place. Allocates nothing.
std::uint64_t ReadPayloadBytes(StorePayload payload, const void* bytes);

// The number that a scan makes of one more payload.
inline std::uint64_t ScanStep(std::uint64_t sum, std::uint64_t payload) {
  return sum * 31 + payload;
}

// Payloads are handed over as bytes made beforehand, so that no peer pays for making them, and read in place,
// so that none pays for decoding them.
class BytesPeer : public StorePeer {
 public:
  explicit BytesPeer(const StoreSetup& setup);

  void Put(const FieldId& key, std::size_t payload) final {
    PutBytes(PackedKey(key).view(), m_payloads[payload % m_payloads.size()]);
  }
  void Erase(const FieldId& key) final { EraseBytes(PackedKey(key).view()); }
  std::uint64_t Find(const FieldId& key) final { return FindBytes(PackedKey(key).view()); }

 protected:
  virtual void PutBytes(std::string_view key, std::string_view payload) = 0;
  virtual void EraseBytes(std::string_view key) = 0;
  virtual std::uint64_t FindBytes(std::string_view key) = 0;

  std::uint64_t Read(const void* bytes) const { return ReadPayloadBytes(m_payload, bytes); }

 private:
  StorePayload m_payload;
  std::vector<std::string> m_payloads;
};

}  // namespace vemo::bench
