#include "store/view.h"

#include <utility>

#include "platform/error.h"
#include "store/envelope.h"
#include "vxUtils/Archive.h"

namespace vemo {

namespace {

thread_local View* t_readingView = nullptr;

class ReadingScope {
 public:
  explicit ReadingScope(View* view) noexcept : m_outer(std::exchange(t_readingView, view)) {}
  ~ReadingScope() { t_readingView = m_outer; }
  ReadingScope(const ReadingScope&) = delete;
  ReadingScope& operator=(const ReadingScope&) = delete;

 private:
  View* m_outer;
};

class UnbindVisitor : public IObjectVisitor {
 public:
  UnbindVisitor(const IdSet& ids, const View* view) : m_ids(ids), m_view(view) {}
  void VisitObject(ptr<const IObject>) override {}
  void VisitEvictableObject(const prefbase& reference) override {
    if (reference.m_ptr.m_self == nullptr || !m_ids.Contains(reference.m_oid)) return;
    reference.m_ptr.m_self = nullptr;
    reference.m_ptr.m_table = m_view;
  }

 private:
  const IdSet& m_ids;
  const View* m_view;
};

// Empty for a table that is null or of no class of the maps.
std::string_view NameOf(const IPersistable::FnTable* table) {
  const ClassEntry* found = table == nullptr ? nullptr : FindClass(table);
  return found == nullptr ? std::string_view() : found->Name();
}

}  // namespace

View* ReadingView() noexcept { return t_readingView; }

View::View(CSpace& space, std::string spaceName, Kind kind, CacheCounters& counters, std::uint64_t seed)
    : m_space(space),
      m_spaceName(std::move(spaceName)),
      m_kind(kind),
      m_residents(counters, seed),
      m_counters(counters),
      m_roots(*this) {}

View::~View() { ForgetResidents(); }

void View::Attach(std::unique_ptr<EngineSnapshot> state) {
  const bool moved = state->Generation() != m_generation;
  m_state = std::move(state);
  if (moved || m_roots.AreStale()) ForgetResidents();
  if (moved) {
    m_generation = m_state->Generation();
    m_classes.Clear();
  }
  if (m_classes.Size() == 0) m_classes.Read(State(), m_spaceName);
  if (m_roots.AreStale()) m_roots.Reload();
}

const EngineSnapshot& View::State() const {
  if (m_expiry && m_expiry()) {
    m_state.reset();  // its pages can be used again
    throw SnapshotExpired(m_spaceName + ": the snapshot has been open for longer than the space allows; refresh it or take another",
                          Place(OID()));
  }
  if (m_state == nullptr) {
    throw UsageError(m_spaceName + ": a map of the writer was read outside a transaction; open one, or take a Snapshot");
  }
  return *m_state;
}

// What did not change keeps its place in memory: a record that the same commit wrote has the same bytes. References to what
// did change are unbound.
void View::MoveTo(std::unique_ptr<EngineSnapshot> state) {
  if (state->Generation() == m_generation && !m_roots.AreStale()) {
    m_state = std::move(state);
    return;
  }
  std::vector<OID> changed;
  IdSet gone;
  for (const auto& [oid, resident] : m_residents.All()) {
    const std::optional<ByteView> record = state->Read(oid);
    if (record && CommitOfRecord(*record) == resident.commit) continue;
    changed.push_back(oid);
    gone.Insert(oid);
  }
  m_state = std::move(state);
  m_generation = m_state->Generation();
  for (const OID oid : changed) {
    DestroyObject(Find(oid));
    Release(oid);
  }
  Unbind(gone);
  m_roots.Forget();
  m_classes.Read(State(), m_spaceName);
  m_roots.Reload();
}

void View::Unbind(const IdSet& ids) const {
  UnbindVisitor visitor(ids, this);
  for (const auto& [oid, resident] : m_residents.All()) {
    resident.object.Table()->_IObject.VisitObjects(resident.object.m_self, visitor);
  }
  m_roots.VisitObjects(visitor);
}

bool View::Trim(std::size_t allowance) {
  if (m_residents.EvictableBytes() <= allowance) return false;
  const Residents::Choice choice = m_residents.Choose(allowance);
  Unbind(choice.unbound);
  for (const OID oid : choice.leaving) {
    const ptr<IPersistable> object = Find(oid);
    Release(oid);
    DestroyObject(object);
  }
  CacheCounters::Add(m_counters.evictions, choice.leaving.size());
  CacheCounters::Add(m_counters.passes, 1);
  return true;
}

std::string View::Describe(OID oid, std::string_view className, std::string_view reason) const {
  std::string text = m_spaceName + ": object " + std::to_string(oid.m_value);
  if (!className.empty()) text += " (" + std::string(className) + ")";
  return text += ": " + std::string(reason);
}

ErrorPlace View::Place(OID oid, std::string_view className, std::string_view root) const {
  return {m_spaceName, std::string(root), oid, std::string(className), std::nullopt};
}

// --- Objects ---

ptr<IPersistable> View::Find(OID oid) const noexcept { return m_residents.Find(oid); }

ptr<IPersistable> View::InMemory(const prefbase& reference, const IPersistable::FnTable* expected) {
  ptr<IPersistable> object = reference.m_ptr;
  if (object.m_self == nullptr) {
    if (reference.m_ptr.m_table != this) {
      throw UsageError(m_spaceName + ": the map was not taken from " + UseName() + " that it is to be read with");
    }
    const UseCheck::Scope use(m_use, m_spaceName, UseName());
    object = Find(reference.m_oid);
  }
  if (object.m_self != nullptr && object.Table() != expected) RefuseClass(reference.m_oid, object.Table(), expected);
  return object;
}

void View::Own(ptr<IPersistable> object, OID oid) noexcept {
  ObjSysState& state = SysStateOf(object);
  state.m_cspace = &m_space;
  if (m_kind == Kind::kSnapshot) state.SetFlag(kSnapshotFlag);
  PersistStateOf(object).m_oid = oid;
}

bool View::Holds(OID oid, const void* self) const {
  if (m_roots.Holds(self)) return true;
  const std::lock_guard lock(m_residentsMutex);
  return Find(oid).m_self == self;
}

void View::Adopt(OID oid, ptr<IPersistable> object, std::uint64_t commit) {
  {
    const std::lock_guard lock(m_residentsMutex);
    m_residents.Add(oid, object, commit);
  }
  Own(object, oid);
}

void View::Release(OID oid) noexcept {
  const std::lock_guard lock(m_residentsMutex);
  m_residents.Remove(oid);
}

ptr<IPersistable> View::Resolve(OID oid, const IPersistable::FnTable* expected) {
  const UseCheck::Scope use(m_use, m_spaceName, UseName());
  ptr<IPersistable> object = m_residents.Use(oid);
  if (object.m_self == nullptr) {
    const ByteView record = RequireRecord(oid, expected);
    object = Decode(oid, record, expected);
    try {
      Adopt(oid, object, CommitOfRecord(record));
    } catch (...) {
      DestroyObject(object);
      throw;
    }
    CacheCounters::Add(m_counters.loads, 1);
  }
  if (expected != nullptr && object.Table() != expected) RefuseClass(oid, object.Table(), expected);
  return object;
}

ByteView View::RequireRecord(OID oid, const IPersistable::FnTable* expected) const {
  if (const std::optional<ByteView> record = State().Read(oid)) return *record;
  const std::string_view className = NameOf(expected);
  throw DanglingReference(Describe(oid, className, "it is referred to, but there is no record of it (run vemo verify)"),
                          Place(oid, className));
}

ByteView View::ReadStored(OID oid, const IPersistable::FnTable* expected) {
  const UseCheck::Scope use(m_use, m_spaceName, UseName());
  try {
    const RecordEnvelope envelope = OpenRecord(RequireRecord(oid, expected), oid);
    const IPersistable::FnTable* found = ClassOf(oid, envelope.classNumber, expected).table;
    if (found != expected) RefuseClass(oid, found, expected);
    return envelope.body;
  } catch (const MalformedBytes& malformed) {
    RefuseForm(oid, expected, malformed);
  }
}

void View::RefuseForm(OID oid, const IPersistable::FnTable* expected, const MalformedBytes& fault) const {
  RefuseForm(oid, NameOf(expected), fault);
}

void View::RefuseForm(OID oid, std::string_view className, const MalformedBytes& fault) const {
  ErrorPlace place = Place(oid, className);
  place.offset = fault.offset();
  throw CorruptRecord(Describe(oid, className, fault.what()), std::move(place));
}

void View::RefuseClass(OID oid, const IPersistable::FnTable* found, const IPersistable::FnTable* expected) const {
  const std::string_view wanted = NameOf(expected);
  const std::string_view className = NameOf(found);
  throw CorruptRecord(Describe(oid, className,
                               "a " + std::string(!wanted.empty() ? wanted : "different class") +
                                   " should stand here (run vemo verify)"),
                      Place(oid, className));
}

ptr<IPersistable> View::Decode(OID oid, ByteView record, const IPersistable::FnTable* expected) {
  std::string_view className;  // while it is empty, the record has not told it
  ptr<IPersistable> object;
  try {
    const RecordEnvelope envelope = OpenRecord(record, oid);
    const ClassEntry& classEntry = ClassOf(oid, envelope.classNumber, expected);
    className = classEntry.Name();
    BoundedReader reader(envelope.body);
    classEntry.checkForm(reader);
    reader.ExpectEnd();
    object = ptr<IPersistable>(classEntry.reflected->m_createFn().m_self, classEntry.table);
    ReadBody(object, envelope.body);
    return object;
  } catch (const MalformedBytes& malformed) {
    if (object.m_self != nullptr) DestroyObject(object);
    RefuseForm(oid, className.empty() ? NameOf(expected) : className, malformed);
  } catch (...) {
    if (object.m_self != nullptr) DestroyObject(object);
    throw;
  }
}

void View::DecodeInto(ptr<IPersistable> object, OID oid, ByteView record) { ReadBody(object, OpenRecord(record, oid).body); }

void View::ReadBody(ptr<IPersistable> object, ByteView body) {
  const ReadingScope scope(this);
  InputArchive archive(body.data());
  object.Table()->Deserialise(object.m_self, archive);
}

const ClassEntry& View::ClassOf(OID oid, std::uint32_t number, const IPersistable::FnTable* expected) const {
  if (const ClassEntry* found = m_classes.Find(number)) return *found;
  throw CorruptRecord(
      Describe(oid, NameOf(expected), "its class number " + std::to_string(number) + " names no class known here"),
      Place(oid, NameOf(expected)));
}

std::string_view View::ClassInHead(ByteView record) const noexcept {
  const ClassEntry* found = m_classes.Find(ClassNumberOfRecord(record));
  return found == nullptr ? std::string_view() : found->Name();
}

void View::ForgetResidents() noexcept {
  Residents::Table forgotten;
  {
    const std::lock_guard lock(m_residentsMutex);
    forgotten = m_residents.TakeAll();
  }
  for (const auto& [oid, resident] : forgotten) DestroyObject(resident.object);
  m_roots.Forget();
}

}  // namespace vemo
