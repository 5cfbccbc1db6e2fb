// The byte form and the text form of one value, for every type that has them.
#pragma once

#include <cstdint>
#include <span>
#include <sstream>
#include <string>
#include <utility>

#include "platform/types.h"
#include "platform/xostream.h"
#include "vxUtils/Archive.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

// An output stream that collects what it gets.
class BytesOutputStream : public IOutputStream {
 public:
  void WriteStream(const void* bytes, ssize_t count) override {
    const auto* first = static_cast<const std::uint8_t*>(bytes);
    m_bytes.insert(m_bytes.end(), first, first + count);
  }

  Bytes m_bytes;
};

// The bytes that Serialise writes for `x`.
template <class T>
Bytes ToBytes(const T& x) {
  BytesOutputStream stream;
  Archive ar(&stream);
  Serialise(ar, x);
  ar.Flush();
  return std::move(stream.m_bytes);
}

// Replaces `x` by what `bytes` hold; nothing is assumed about them. Throws MalformedBytes, which leaves `x`
// as it was, when they are not the form of a T from the first byte to the last. An allocation that fails
// leaves `x` valid, with an unspecified part of the new contents.
template <class T>
void FromBytes(std::span<const std::uint8_t> bytes, T& x) {
  BoundedReader reader(bytes);
  CheckForm(reader, static_cast<const T*>(&x));
  reader.ExpectEnd();
  InputArchive ar(bytes.data());
  Deserialise(ar, x);
}

// What `os << x` writes.
template <class T>
std::string ToText(const T& x) {
  std::ostringstream out;
  xostream os(out);
  os << x;
  return std::move(out).str();
}

}  // namespace vemo
