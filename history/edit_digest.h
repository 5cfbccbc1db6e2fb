// A running digest of edits, by which a source is known again.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "history/edit_source.h"

namespace vemo {

class EditDigest {
 public:
  EditDigest();
  ~EditDigest();
  EditDigest(const EditDigest&) = delete;
  EditDigest& operator=(const EditDigest&) = delete;

  void Add(const Edit& edit);

  // The XXH3-64 of all edits so far, in 16 hexadecimal digits; adding can go on.
  std::string Text() const;

 private:
  void AddNumber(std::uint64_t number);
  void AddBytes(const void* bytes, std::size_t count);

  struct State;
  std::unique_ptr<State> m_state;
};

// `number` in 16 hexadecimal digits.
std::string HexText(std::uint64_t number);

}  // namespace vemo
