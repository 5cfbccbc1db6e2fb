#include "history/edit_digest.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

namespace vemo {

struct EditDigest::State {
  XXH3_state_t xxh3;
};

EditDigest::EditDigest() : m_state(std::make_unique<State>()) {
  XXH3_64bits_reset(&m_state->xxh3);
}
EditDigest::~EditDigest() = default;

void EditDigest::AddBytes(const void* bytes, std::size_t count) {
  XXH3_64bits_update(&m_state->xxh3, bytes, count);
}
void EditDigest::AddNumber(std::uint64_t number) {
  AddBytes(&number, sizeof(number));
}

void EditDigest::Add(const Edit& edit) {
  AddBytes(&edit.site, sizeof(edit.site));
  AddNumber(edit.field.oid.m_value);
  AddNumber(edit.field.path.size());
  for (const Path::Element element : edit.field.path.elements()) AddNumber(element);
  AddNumber(static_cast<std::uint64_t>(edit.position));
  AddNumber(static_cast<std::uint64_t>(edit.deleted));
  AddNumber(edit.inserted.size());
  for (const std::string_view element : edit.inserted) {
    AddNumber(element.size());
    AddBytes(element.data(), element.size());
  }
}

std::string EditDigest::Text() const {
  return HexText(XXH3_64bits_digest(&m_state->xxh3));
}

std::string HexText(std::uint64_t number) {
  constexpr char kDigits[] = "0123456789abcdef";
  std::string text(16, '0');
  for (int i = 15; i >= 0; --i, number >>= 4) text[static_cast<std::size_t>(i)] = kDigits[number & 15];
  return text;
}

}  // namespace vemo
