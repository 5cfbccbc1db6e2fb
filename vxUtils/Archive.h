// The byte archives through which every record is written and read.
#pragma once

#include <cstdint>
#include <cstring>
#include <string>

#include "platform/assertion.h"
#include "platform/field_id.h"
#include "platform/guid.h"
#include "platform/types.h"
#include "platform/variable_length.h"

namespace vemo {

inline constexpr ssize_t ARCHIVE_BUFSIZE = 4096;

// Where an Archive puts its full buffers. May throw; the archive passes the exception on.
class IOutputStream {
 public:
  virtual ~IOutputStream() = default;
  virtual void WriteStream(const void* bytes, ssize_t count) = 0;
};

// A hook for hosts that write the upper halves of object ids in a form of their own.
class IItemSerialiser;

// A buffered writer in front of an output stream, which it does not own. What is in the buffer reaches the stream with
// FlushBuffer or Flush only: the destructor writes nothing. Not thread-safe. Writing allocates nothing.
class Archive {
 public:
  explicit Archive(IOutputStream* stream) noexcept : m_pos(m_writeBuffer), m_oStream(stream) {}
  Archive(const Archive&) = delete;
  Archive& operator=(const Archive&) = delete;

  // A pointer at which up to `reserveSize` bytes (at most ARCHIVE_BUFSIZE) may be written; EndWrite commits them.
  std::uint8_t* BeginWrite(ssize_t reserveSize) {
    AssertPosInBuffer();
    VEMO_ASSERT(reserveSize <= ARCHIVE_BUFSIZE);
    if (m_pos - m_writeBuffer > ARCHIVE_BUFSIZE - reserveSize) FlushBuffer();
    return m_pos;
  }

  void EndWrite(std::uint8_t* pos) {
    VEMO_ASSERT_TEXT(m_writeBuffer <= m_pos && m_pos <= pos && pos <= m_writeBuffer + ARCHIVE_BUFSIZE,
                     "m_writeBuffer <= m_pos && m_pos <= pos && pos <= m_writeBuffer+ARCHIVE_BUFSIZE");
    m_pos = pos;
  }

  // As BeginWrite, where that would not have to make room; else null. For several items at once.
  std::uint8_t* BeginWriteIfRoom(std::size_t reserveSize) {
    AssertPosInBuffer();
    return reserveSize <= static_cast<std::size_t>(m_writeBuffer + ARCHIVE_BUFSIZE - m_pos) ? m_pos : nullptr;
  }

  // Writes the bytes of a plain value as they lie in memory.
  template <class T>
  void SerialisePod(const T& value) {
    AssertPosInBuffer();
    if (m_pos > m_writeBuffer + (ARCHIVE_BUFSIZE - static_cast<ssize_t>(sizeof(T)))) FlushBuffer();
    std::memcpy(m_pos, &value, sizeof(T));
    m_pos += sizeof(T);
  }

  // Hands the buffered bytes to the stream.
  void FlushBuffer();
  void Flush() { FlushBuffer(); }

  ssize_t NumBufferedWrites() const noexcept { return m_pos - m_writeBuffer; }
  ssize_t GetNumBytesWrittenToStream() const noexcept { return m_numBytesWrittenToStream; }
  ssize_t GetNumBytesWritten() const noexcept { return m_numBytesWrittenToStream + NumBufferedWrites(); }

  std::uint8_t m_writeBuffer[ARCHIVE_BUFSIZE];
  std::uint8_t* m_pos;
  IOutputStream* m_oStream;
  ssize_t m_numBytesWrittenToStream = 0;
  IItemSerialiser* m_oidHighSerialiser = nullptr;

 private:
  void AssertPosInBuffer() const {
    VEMO_ASSERT_TEXT(m_writeBuffer <= m_pos && m_pos <= m_writeBuffer + ARCHIVE_BUFSIZE,
                     "m_writeBuffer <= m_pos && m_pos <= m_writeBuffer+ARCHIVE_BUFSIZE");
  }
};

// A cursor over bytes in memory, which it does not own. It carries no end: readers trust their input, so bytes from
// outside pass a BoundedReader first.
//
// A cursor may be copied. What reads keys and the most common payload is inlined always: the copy that a loop keeps to itself
// then stays in a register.
class InputArchive {
 public:
  explicit InputArchive(const std::uint8_t* p) noexcept : p_(p) {}

  const std::uint8_t* ptr() const noexcept { return p_; }
  void SetPtr(const std::uint8_t* p) noexcept { p_ = p; }

  template <class T>
  void DeserialisePod(T& value) noexcept {
    std::memcpy(&value, p_, sizeof(T));
    p_ += sizeof(T);
  }

  const std::uint8_t* p_;
};

// Writes the low 32 bits of `value` at `p` and returns the pointer after them; the upper half is dropped unseen.
template <class T>
std::uint8_t* SerialiseVariableLengthInteger(std::uint8_t* p, T value) noexcept {
  return SerialiseVariableLengthUint32(p, static_cast<std::uint32_t>(value));
}

template <class T>
void SerialiseVariableLengthUint(Archive& ar, T value) {
  std::uint8_t* p = ar.BeginWrite(MAX_VARIABLE_LENGTH_UINT_SIZE);
  p = SerialiseVariableLengthInteger<T>(p, value);
  ar.EndWrite(p);
}

// The same for several values, with one look at the room in the buffer.
template <class... T>
void SerialiseVariableLengthUints(Archive& ar, T... values) {
  if (std::uint8_t* p = ar.BeginWriteIfRoom(sizeof...(values) * MAX_VARIABLE_LENGTH_UINT_SIZE)) {
    ((p = SerialiseVariableLengthInteger(p, values)), ...);
    ar.EndWrite(p);
  } else {
    (SerialiseVariableLengthUint(ar, values), ...);
  }
}

// Reads a 32-bit value, zero-extended: what was written from -1 is 4294967295.
template <class T>
const std::uint8_t* DeserialiseVariableLengthInteger(const std::uint8_t* p, T& value) noexcept {
  std::uint32_t x = 0;
  p = DeserialiseVariableLengthUint32(p, x);
  value = static_cast<T>(x);
  return p;
}

template <class T>
void DeserialiseVariableLengthUint(InputArchive& ar, T& value) noexcept {
  ar.SetPtr(DeserialiseVariableLengthInteger<T>(ar.ptr(), value));
}

// Selects the compressed form of an integer.
template <class T>
struct CompressedInt {
  T val;
};

inline CompressedInt<int> AsCompressedInt(int value) noexcept { return {value}; }

inline void Serialise(Archive& ar, CompressedInt<int> value) { SerialiseVariableLengthUint<int>(ar, value.val); }

// The schema number of a class, the first item of its record.
void SerialiseSchema(Archive& ar, int schema);

// Reads a schema number. Throws MalformedBytes when it is 0 or newer than `currentSchema`.
void DeserialiseSchema(InputArchive& ar, int currentSchema, int& schema);

inline void Serialise(Archive& ar, const Guid& guid) { ar.SerialisePod(guid); }
inline void Deserialise(InputArchive& ar, Guid& guid) noexcept { ar.DeserialisePod(guid); }

// An id is one variable-length 64-bit value; a FieldId is its object id, the number of steps and each step.
void Serialise(Archive& ar, const OID& oid);
inline void Deserialise(InputArchive& ar, OID& oid) noexcept {
  ar.SetPtr(DeserialiseVariableLengthUint64(ar.ptr(), oid.m_value));
}
void Serialise(Archive& ar, const FieldId& field);
[[gnu::always_inline]] inline void Deserialise(InputArchive& ar, FieldId& field) {
  const std::uint8_t* p = DeserialiseVariableLengthUint64(ar.ptr(), field.oid.m_value);
  std::uint32_t size = 0;
  p = DeserialiseVariableLengthUint32(p, size);
  for (Path::Element& element : field.path.Resize(size)) p = DeserialiseVariableLengthUint32(p, element);
  ar.SetPtr(p);
}

template <class T>
Archive& operator<<(Archive& ar, const T& value) {
  Serialise(ar, value);
  return ar;
}

template <class T>
[[gnu::always_inline]] inline InputArchive& operator>>(InputArchive& ar, T& value) {
  Deserialise(ar, value);
  return ar;
}

}  // namespace vemo
