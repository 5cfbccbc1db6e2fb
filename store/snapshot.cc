#include "store/snapshot.h"

#include <unistd.h>

#include <utility>

#include "store/meta.h"
#include "store/names.h"

namespace vemo {

Snapshot::Snapshot(CSpace& space, std::string owner)
    : m_space(space),
      m_owner(std::move(owner)),
      m_opened(space.m_options.clock()),
      m_view(space, space.m_engine->Name(), View::Kind::kSnapshot, space.m_counters, space.m_options.cacheSeed) {
  space.RequireThisProcess();
  Begin();
  m_view.Attach(space.m_engine->OpenSnapshot());
  space.EnterSnapshot(*this);
}

// Starts the snapshot's age.
void Snapshot::Begin() {
  const std::lock_guard lock(m_space.m_snapshotsMutex);
  m_opened = m_space.m_options.clock();
  if (!m_space.m_options.readerMaxAge) return;
  m_view.SetExpiry([&clock = m_space.m_options.clock, end = m_opened + *m_space.m_options.readerMaxAge] {
    return clock() > end;
  });
}

void Snapshot::Refresh() {
  const UseCheck::Scope use(m_view.Use(), m_space.Name(), m_view.UseName());
  auto state = m_space.m_engine->OpenSnapshot();
  Begin();
  m_view.Trim(m_space.Allowance());
  m_view.MoveTo(std::move(state));
}

bool Snapshot::TrimTo(std::size_t bytes) {
  const UseCheck::Scope use(m_view.Use(), m_space.Name(), m_view.UseName());
  return m_view.Trim(bytes);
}

void Snapshot::RequireUse() const { m_view.Use().RequireThisProcess(m_space.Name(), m_view.UseName()); }

ReaderInfo Snapshot::Describe(std::chrono::steady_clock::time_point now) const {
  return {m_owner, getpid(), m_view.Generation(), std::chrono::duration_cast<std::chrono::milliseconds>(now - m_opened)};
}

Snapshot::~Snapshot() {
  if (m_view.Use().IsOfThisProcess()) m_space.LeaveSnapshot(*this);
}

ptr<IPersistable> Snapshot::RootMap(std::string_view name) {
  const UseCheck::Scope use(m_view.Use(), m_space.Name(), m_view.UseName());
  const RootMaps::Root* root = m_view.Roots().Find(name);
  if (root == nullptr) throw UsageError(m_space.Name() + ": it has no root map \"" + std::string(name) + "\"");
  return root->map;
}

void Snapshot::RefuseRoot(std::string_view name, const IPersistable::FnTable* table) {
  throw UsageError(m_space.Name() + ": root \"" + std::string(name) + "\" is a " +
                   std::string(m_view.Roots().Find(name)->classEntry->Name()) + ", not a " +
                   std::string(FindClass(table)->Name()));
}

bool Snapshot::HasRoot(std::string_view name) const {
  RequireUse();
  return m_view.State().ReadNamed(NamedTable::kRoots, name).has_value();
}

std::vector<std::string> Snapshot::RootNames() const {
  RequireUse();
  std::vector<std::string> names;
  m_view.State().ScanNamed(NamedTable::kRoots, "", [&](std::string_view name, ByteView) {
    if (!IsOwnedRootName(name)) names.emplace_back(name);
    return true;
  });
  return names;
}

std::optional<std::string> Snapshot::Meta(std::string_view name) const {
  RequireUse();
  return ReadMeta(m_view.State(), m_space.Name(), name);
}

void Snapshot::ScanMeta(std::string_view prefix,
                        const std::function<bool(std::string_view, std::string_view)>& visit) const {
  RequireUse();
  ScanStoredMeta(m_view.State(), m_space.Name(), prefix, visit);
}

bool Snapshot::ForgetIfHolds(OID oid, const void* self) noexcept {
  if (!m_view.Holds(oid, self)) return false;
  m_view.ForgetResidents();
  try {
    m_view.Roots().Reload();
  } catch (const std::exception&) {
    // The roots stay stale, and whoever asks for one next gets the exception.
  }
  return true;
}

}  // namespace vemo
