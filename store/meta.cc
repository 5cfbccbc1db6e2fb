#include "store/meta.h"

#include <utility>

#include "platform/error.h"
#include "store/envelope.h"

namespace vemo {

namespace {

std::string_view AsText(ByteView bytes) { return {reinterpret_cast<const char*>(bytes.data()), bytes.size()}; }

std::string_view OpenMeta(const std::string& spaceName, std::string_view name, ByteView sealed) {
  try {
    return AsText(OpenNamed(NamedTable::kMeta, name, sealed));
  } catch (const MalformedBytes& malformed) {
    throw CorruptRecord(spaceName + ": meta value \"" + std::string(name) + "\": " + malformed.what(),
                        {spaceName, "", OID(), "", std::nullopt});
  }
}

}  // namespace

std::optional<std::string> ReadMeta(const EngineSnapshot& state, const std::string& spaceName, std::string_view name) {
  const std::optional<ByteView> sealed = state.ReadNamed(NamedTable::kMeta, name);
  if (!sealed) return std::nullopt;
  return std::string(OpenMeta(spaceName, name, *sealed));
}

void ScanStoredMeta(const EngineSnapshot& state, const std::string& spaceName, std::string_view prefix,
                    const MetaVisitor& visit) {
  state.ScanNamed(NamedTable::kMeta, prefix, [&](std::string_view name, ByteView sealed) {
    return visit(name, OpenMeta(spaceName, name, sealed));
  });
}

void MetaChanges::Set(std::string_view name, std::string_view value) {
  m_values.insert_or_assign(std::string(name), std::string(value));
}

void MetaChanges::Erase(std::string_view name) { m_values.insert_or_assign(std::string(name), std::nullopt); }

const std::optional<std::string>* MetaChanges::Find(std::string_view name) const {
  const auto found = m_values.find(name);
  return found == m_values.end() ? nullptr : &found->second;
}

void MetaChanges::Scan(const EngineSnapshot& state, const std::string& spaceName, std::string_view prefix,
                       const MetaVisitor& visit) const {
  auto changed = m_values.lower_bound(prefix);
  bool goOn = true;
  // Visits the changed values that come before `name`; returns whether `name` itself is one of them.
  const auto visitChangedUpTo = [&](const std::optional<std::string_view>& name) {
    while (goOn && changed != m_values.end() && changed->first.starts_with(prefix) && (!name || changed->first <= *name)) {
      const bool isName = name && changed->first == *name;
      if (changed->second) goOn = visit(changed->first, *changed->second);
      ++changed;
      if (isName) return true;
    }
    return false;
  };
  ScanStoredMeta(state, spaceName, prefix,
                 [&](std::string_view name, std::string_view value) {
                   if (!visitChangedUpTo(name) && goOn) goOn = visit(name, value);
                   return goOn;
                 });
  visitChangedUpTo(std::nullopt);
}

void MetaChanges::AddTo(CommitBatch& batch) const {
  for (const auto& [name, value] : m_values) {
    std::optional<Bytes> sealed;
    if (value) {
      const ByteView bytes(reinterpret_cast<const std::uint8_t*>(value->data()), value->size());
      sealed = SealNamed(NamedTable::kMeta, name, bytes);
    }
    batch.namedValues.push_back({NamedTable::kMeta, name, std::move(sealed)});
  }
}

}  // namespace vemo
