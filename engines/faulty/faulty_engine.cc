#include "engines/faulty/faulty_engine.h"

#include <utility>

#include "engines/faulty/undo_log.h"

namespace vemo {

namespace {

const char* NameOf(EngineCall call) {
  switch (call) {
    case EngineCall::kOpenSnapshot: return "open a snapshot of";
    case EngineCall::kRead: return "read a record of";
    case EngineCall::kScanRecords: return "scan the records of";
    case EngineCall::kReadNamed: return "read a named value of";
    case EngineCall::kScanNamed: return "scan the named values of";
    case EngineCall::kQueuedDeletions: return "read the queue of deletions of";
    case EngineCall::kCommit: return "commit to";
    case EngineCall::kReserveIds: return "reserve ids in";
    case EngineCall::kLockWriter: return "lock for writing";
    case EngineCall::kUsage: return "measure";
    case EngineCall::kReadersElsewhere: return "list readers of";
  }
  return "use";
}

bool ChangesSpace(EngineCall call) { return call == EngineCall::kCommit || call == EngineCall::kReserveIds; }

// The faults of one engine, applied to its calls.
class Gate {
 public:
  Gate(std::string space, FaultPlan& plan) : m_space(std::move(space)), m_plan(plan) {}

  FaultPlan& plan() const noexcept { return m_plan; }

  // Calls `act`, or fails in its place, or after it.
  template <class Act>
  auto Run(EngineCall call, Act&& act) const {
    const std::optional<Fault> fault = m_plan.Pass(call);
    if (!fault) return act();
    switch (*fault) {
      case Fault::kNoSpace: throw InjectedFault(Message(call, "no space left (injected); make room and try again"));
      case Fault::kIoError: throw InjectedFault(Message(call, "input/output error (injected); see to the medium"));
      case Fault::kStall:
        if (m_plan.onStall) m_plan.onStall(call);
        return act();
      case Fault::kDeliveredTwice:
        if (ChangesSpace(call)) act();
        return act();
      case Fault::kUnknownApplied:
        if (ChangesSpace(call)) act();
        break;
      case Fault::kUnknownDropped: break;
    }
    if (call != EngineCall::kCommit) throw InjectedFault(Message(call, "input/output error (injected); see to the medium"));
    throw UnknownOutcome(Message(call, "the answer was lost (injected); look whether it was done"));
  }

  void Pass(EngineCall call) const {
    Run(call, [] {});
  }

 private:
  std::string Message(EngineCall call, const char* reason) const {
    return std::string("cannot ") + NameOf(call) + " " + m_space + ": " + reason;
  }

  std::string m_space;
  FaultPlan& m_plan;
};

class FaultySnapshot final : public EngineSnapshot {
 public:
  FaultySnapshot(std::unique_ptr<EngineSnapshot> inner, Gate gate, std::uint64_t offset)
      : m_inner(std::move(inner)), m_gate(std::move(gate)), m_offset(offset) {}

  std::uint64_t Generation() const override { return m_inner->Generation() - m_offset; }
  std::optional<ByteView> Read(OID oid) const override {
    return m_gate.Run(EngineCall::kRead, [&] { return m_inner->Read(oid); });
  }
  void ScanRecords(OID first, const std::function<bool(OID, ByteView)>& visit) const override {
    m_gate.Pass(EngineCall::kScanRecords);
    m_inner->ScanRecords(first, [&](OID oid, ByteView record) {
      m_gate.Pass(EngineCall::kScanRecords);
      return visit(oid, record);
    });
  }
  std::optional<ByteView> ReadNamed(NamedTable table, std::string_view name) const override {
    return m_gate.Run(EngineCall::kReadNamed, [&] { return m_inner->ReadNamed(table, name); });
  }
  void ScanNamed(NamedTable table, std::string_view prefix,
                 const std::function<bool(std::string_view, ByteView)>& visit) const override {
    m_gate.Pass(EngineCall::kScanNamed);
    m_inner->ScanNamed(table, prefix, [&](std::string_view name, ByteView value) {
      m_gate.Pass(EngineCall::kScanNamed);
      return visit(name, value);
    });
  }
  std::vector<OID> QueuedDeletions(std::size_t limit) const override {
    return m_gate.Run(EngineCall::kQueuedDeletions, [&] { return m_inner->QueuedDeletions(limit); });
  }
  std::vector<StorageFinding> CheckStorage() const override { return m_inner->CheckStorage(); }

 private:
  std::unique_ptr<EngineSnapshot> m_inner;
  Gate m_gate;
  std::uint64_t m_offset;
};

class FaultyEngine final : public Engine {
 public:
  FaultyEngine(std::shared_ptr<Engine> inner, FaultPlan& plan) : m_inner(std::move(inner)), m_gate(m_inner->Name(), plan) {}

  std::string Name() const override { return m_inner->Name(); }

  std::unique_ptr<EngineSnapshot> OpenSnapshot() override {
    const std::uint64_t offset = LoseTail();
    return m_gate.Run(EngineCall::kOpenSnapshot,
                      [&] { return std::make_unique<FaultySnapshot>(m_inner->OpenSnapshot(), m_gate, offset); });
  }

  std::uint64_t Commit(const CommitBatch& batch) override {
    const std::uint64_t offset = LoseTail();
    return m_gate.Run(EngineCall::kCommit, [&] { return CommitInner(batch, offset); });
  }

  OID ReserveIds(std::uint64_t count) override {
    return m_gate.Run(EngineCall::kReserveIds, [&] { return m_inner->ReserveIds(count); });
  }
  std::unique_ptr<WriterLock> LockWriter(std::chrono::milliseconds timeout) override {
    return m_gate.Run(EngineCall::kLockWriter, [&] { return m_inner->LockWriter(timeout); });
  }
  EngineUsage Usage() override {
    return m_gate.Run(EngineCall::kUsage, [&] { return m_inner->Usage(); });
  }
  std::vector<std::int64_t> ReadersElsewhere() override {
    return m_gate.Run(EngineCall::kReadersElsewhere, [&] { return m_inner->ReadersElsewhere(); });
  }

 private:
  // Takes back what is to be lost; returns by how many commits the inner engine stands higher than what is shown.
  std::uint64_t LoseTail() {
    const std::lock_guard lock(m_undoMutex);
    if (const std::size_t commits = m_gate.plan().TakeTailToLose()) m_undo.TakeBack(*m_inner, commits);
    return m_undo.Offset();
  }

  std::uint64_t CommitInner(const CommitBatch& batch, std::uint64_t offset) {
    const std::size_t kept = m_gate.plan().KeptTail();
    if (kept == 0 && offset == 0) return m_inner->Commit(batch);
    const std::lock_guard lock(m_undoMutex);
    CommitBatch shifted = batch;
    shifted.expectedGeneration += offset;
    m_undo.Remember(*m_inner->OpenSnapshot(), batch, kept);
    try {
      return m_inner->Commit(shifted) - offset;
    } catch (...) {
      m_undo.Forget();
      throw;
    }
  }

  std::shared_ptr<Engine> m_inner;
  Gate m_gate;
  std::mutex m_undoMutex;
  UndoLog m_undo;
};

}  // namespace

void FaultPlan::Set(Fault fault, std::uint64_t nth, std::optional<EngineCall> call, bool persists) {
  const std::lock_guard lock(m_mutex);
  m_fault = fault;
  m_call = call;
  m_untilFault = nth;
  m_persists = persists;
  m_fired = false;
}

void FaultPlan::Clear() noexcept {
  const std::lock_guard lock(m_mutex);
  m_fault.reset();
}

bool FaultPlan::HasFired() const noexcept {
  const std::lock_guard lock(m_mutex);
  return m_fired;
}

void FaultPlan::KeepTail(std::size_t commits) noexcept {
  const std::lock_guard lock(m_mutex);
  m_keptTail = commits;
}

void FaultPlan::LoseTail(std::size_t commits) noexcept {
  const std::lock_guard lock(m_mutex);
  m_tailToLose = commits;
}

std::optional<Fault> FaultPlan::Pass(EngineCall call) noexcept {
  const std::lock_guard lock(m_mutex);
  if (!m_fault || (m_call && *m_call != call)) return std::nullopt;
  if (m_untilFault > 1) {
    --m_untilFault;
    return std::nullopt;
  }
  if (m_fired && !m_persists) return std::nullopt;
  m_fired = true;
  return m_fault;
}

std::size_t FaultPlan::KeptTail() const noexcept {
  const std::lock_guard lock(m_mutex);
  return m_keptTail;
}

std::size_t FaultPlan::TakeTailToLose() noexcept {
  const std::lock_guard lock(m_mutex);
  return std::exchange(m_tailToLose, 0);
}

std::unique_ptr<Engine> MakeFaultyEngine(std::shared_ptr<Engine> engine, FaultPlan& plan) {
  return std::make_unique<FaultyEngine>(std::move(engine), plan);
}

}  // namespace vemo
