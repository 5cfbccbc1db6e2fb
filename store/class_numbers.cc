#include "store/class_numbers.h"

#include <algorithm>
#include <charconv>
#include <utility>

#include "platform/error.h"
#include "store/envelope.h"

namespace vemo {

namespace {

constexpr std::string_view kClassPrefix = "class/";
constexpr std::size_t kMaxClassNumber = 1'000'000;  // far above what classes there can be, and an array that long is small

std::string ClassNumberName(std::size_t number) { return std::string(kClassPrefix) + std::to_string(number); }

std::size_t ParseClassNumber(std::string_view text) {
  std::size_t number = 0;
  const auto result = std::from_chars(text.data(), text.data() + text.size(), number);
  if (result.ec != std::errc() || result.ptr != text.data() + text.size() || number == 0 || number > kMaxClassNumber) {
    throw MalformedBytes(0, "its name ends in no class number");
  }
  return number;
}

}  // namespace

void ClassNumbers::Read(const EngineSnapshot& state, const std::string& spaceName) {
  std::vector<const ClassEntry*> classes;  // taken over when all of it was read: a part would give numbers out twice
  state.ScanNamed(NamedTable::kInfo, kClassPrefix, [&](std::string_view name, ByteView sealed) {
    try {
      const ByteView value = OpenNamed(NamedTable::kInfo, name, sealed);
      const std::size_t number = ParseClassNumber(name.substr(kClassPrefix.size()));
      if (classes.size() < number) classes.resize(number);
      classes[number - 1] = FindClass(std::string_view(reinterpret_cast<const char*>(value.data()), value.size()));
    } catch (const MalformedBytes& malformed) {
      throw CorruptRecord(spaceName + ": class table, \"" + std::string(name) + "\": " + malformed.what(),
                          {spaceName, "", OID(), "", std::nullopt});
    }
    return true;
  });
  m_classes = std::move(classes);
}

const ClassEntry* ClassNumbers::Find(std::uint32_t number) const noexcept {
  return number == 0 || number > m_classes.size() ? nullptr : m_classes[number - 1];
}

std::uint32_t ClassNumbers::NumberOf(const ClassEntry& classEntry) const noexcept {
  const auto found = std::find(m_classes.begin(), m_classes.end(), &classEntry);
  return found == m_classes.end() ? 0 : static_cast<std::uint32_t>(found - m_classes.begin()) + 1;
}

std::uint32_t ClassNumbers::Add(const ClassEntry& classEntry) {
  m_classes.push_back(&classEntry);
  return static_cast<std::uint32_t>(m_classes.size());
}

CommitBatch::NamedValue ClassNumbers::StoredValue(std::size_t number) const {
  const std::string name = ClassNumberName(number);
  const std::string_view className = m_classes[number - 1]->Name();
  const ByteView value(reinterpret_cast<const std::uint8_t*>(className.data()), className.size());
  return {NamedTable::kInfo, name, SealNamed(NamedTable::kInfo, name, value)};
}

}  // namespace vemo
