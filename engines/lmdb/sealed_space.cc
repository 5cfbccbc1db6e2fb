#include "engines/lmdb/sealed_space.h"

#include <chrono>
#include <exception>
#include <thread>
#include <utility>

#include "engines/lmdb/space_folder.h"
#include "engines/lmdb/storage_check.h"

namespace vemo {
namespace {

constexpr std::chrono::milliseconds kLongestWait(5000);
constexpr std::chrono::microseconds kNap(100);

std::string ToText(const StorageFinding& finding) {
  return (finding.page ? "page " + std::to_string(*finding.page) + " of " + kDataFile + ", " : "") + finding.what;
}

}  // namespace

SealedSpace::SealedSpace(const std::filesystem::path& folder, const std::string& space, bool readOnly,
                         std::uint64_t mapBytes)
    : m_space(space),
      m_readOnly(readOnly),
      m_file(std::make_shared<PageFile>(folder / kDataFile, space, mapBytes)),
      m_seal(folder / kSealFile, space, readOnly) {}

void SealedSpace::Throw(const std::string& fault) const {
  throw DamagedStorage(m_space + ": " + fault, {m_space, "", OID(), "", std::nullopt});
}

void SealedSpace::ThrowLostCommit(std::uint64_t transaction) const {
  Throw("the newest commit is missing: " + std::string(kDataFile) + " ends with transaction " +
        std::to_string(transaction) + ", and " + kSealFile + " knows transaction " +
        std::to_string(m_seal.Read().Newest()) +
        " (a meta page is damaged, or the file is older); restore the space from a backup, whole, or remove " + kSealFile +
        " and put an empty file in place of " + kLogFile + " to go on with the older commit");
}

KnownStatePtr SealedSpace::Remember(KnownStatePtr state) {
  const std::lock_guard lock(m_mutex);
  m_known = state;
  return state;
}

KnownStatePtr SealedSpace::Read(const MetaPage& meta) const {
  auto known = std::make_shared<KnownState>();
  known->file = m_file;
  known->state = ReadState(m_file, meta, m_space);
  if (HoldsSpace(m_file, *known->state, m_space)) {
    PageReader reader = MakeReader(m_file, *known->state, m_space);
    known->numbers = ReadNumbers(reader, *known->state);
  }
  if (const PageTable* records = known->state->Table(kRecordsTable)) known->records = records->root.entries;
  if (known->state->free == nullptr) known->doubt = known->state->freeFault;
  return known;
}

void SealedSpace::CheckSealed(const SpaceState& state, const CommitSeal& seal) const {
  if (state.rootsDigest != seal.rootsDigest) {
    Throw("the roots of transaction " + std::to_string(seal.transaction) + " in " + kDataFile +
          " are not those that were committed (its meta page or its main table is damaged); restore the space from a backup");
  }
}

SealedSpace::Answer SealedSpace::Ask(std::uint64_t transaction, bool mayWait, KnownStatePtr& state) {
  {
    const std::lock_guard lock(m_mutex);
    if (m_known != nullptr && m_known->state->transaction() == transaction) {
      state = m_known;
      return Answer::kKnown;
    }
  }
  const auto start = std::chrono::steady_clock::now();
  for (;;) {
    // The meta page first: it is overwritten by the commit after the next one, and its seal is too.
    const std::optional<MetaPage> meta = ReadMeta(*m_file, transaction);
    const SealFile::Slots seals = m_seal.Read();
    if (!meta) return Answer::kAnotherCommit;
    if (const std::optional<CommitSeal> seal = seals.Of(transaction)) {
      auto read = std::make_shared<KnownState>(*Read(*meta));
      CheckSealed(*read->state, *seal);
      if (read->doubt.empty() && read->state->freeDigest != seal->freeDigest) {
        read->doubt = m_space + ": the list of free pages in " + kDataFile + " is not the one that was committed";
      }
      state = Remember(std::move(read));
      return Answer::kKnown;
    }
    if (seals.Newest() > transaction) return Answer::kAnotherCommit;
    if (!mayWait) return Answer::kUnsealed;
    if (m_seal.TryLock()) {
      // Nobody is about to write the seal, unless somebody did between the look at it and the lock.
      const SealFile::Slots now = m_seal.Read();
      if (now.Of(transaction) || now.Newest() > transaction || !ReadMeta(*m_file, transaction)) {
        m_seal.Unlock();
        continue;
      }
      try {
        state = CheckUnsealed(*meta);
      } catch (...) {
        m_seal.Unlock();
        throw;
      }
      m_seal.Unlock();
      return Answer::kKnown;
    }
    if (std::chrono::steady_clock::now() - start > kLongestWait) {
      throw SpaceBusy("cannot read " + m_space + ": another process stays in the middle of a commit; try again");
    }
    std::this_thread::sleep_for(kNap);
  }
}

bool SealedSpace::TryLockCommits(std::chrono::milliseconds timeout) {
  const auto start = std::chrono::steady_clock::now();
  while (!m_seal.TryLock()) {
    if (std::chrono::steady_clock::now() - start > timeout) return false;
    std::this_thread::sleep_for(kNap);
  }
  return true;
}

KnownStatePtr SealedSpace::Known(std::uint64_t transaction) {
  const std::lock_guard lock(m_mutex);
  const bool isKnown = m_known != nullptr && m_known->state->transaction() == transaction && m_known->doubt.empty();
  return isKnown ? m_known : nullptr;
}

// With commits locked. Checks all pages of the newest commit, and seals it where it is sound.
KnownStatePtr SealedSpace::CheckUnsealed(const MetaPage& meta) {
  auto known = std::make_shared<KnownState>(*Read(meta));
  const SpaceState& state = *known->state;
  if (const std::string fault = FaultOfOtherMeta(state); !fault.empty()) {
    Throw(fault + " (a meta page of " + kDataFile + " is damaged); restore the space from a backup");
  }
  const StorageReport report = CheckPages(m_file, state, m_space);
  known->records = report.records;
  if (!report.findings.empty()) {
    known->doubt = ToText(report.findings.front());
    if (report.findings.size() > 1) known->doubt += ", and " + std::to_string(report.findings.size() - 1) + " more faults";
  }
  if (known->doubt.empty()) m_seal.Write(CommitSeal{state.transaction(), state.rootsDigest, state.freeDigest});
  return Remember(std::move(known));
}

// The other meta page has the commit before. Where it has a newer one whose number was damaged, that commit would be lost
// in silence.
std::string SealedSpace::FaultOfOtherMeta(const SpaceState& state) const {
  const std::uint64_t transaction = state.transaction();
  const MetaPage other = ReadMetaPage(*m_file, (transaction + 1) % kMetaPages, state.pageBytes);
  if (other.transaction + 1 != transaction && (transaction != 0 || other.transaction != 0)) {
    return "the meta page of the commit before transaction " + std::to_string(transaction) + " has the number " +
           std::to_string(other.transaction);
  }
  try {
    const auto before = ReadState(m_file, other, m_space);
    if (state.Table(kSystemTable) == nullptr || before->Table(kSystemTable) == nullptr) return {};
    PageReader reader = MakeReader(m_file, state, m_space);
    PageReader readerBefore = MakeReader(m_file, *before, m_space);
    if (ReadNumbers(readerBefore, *before).generation > ReadNumbers(reader, state).generation ||
        ReadNextId(readerBefore, *before) > ReadNextId(reader, state)) {
      return "a newer commit is hidden";
    }
  } catch (const DamagedStorage&) {
    // The pages of older commits may have been used again.
  }
  return {};
}

KnownStatePtr SealedSpace::RequireWritable(std::uint64_t transaction) {
  const HeaderFault header = FaultOfHeader(*m_file);
  if (!header.fault.empty()) Throw(std::string(kDataFile) + ": " + header.fault + "; restore the space from a backup");
  const std::optional<MetaPage> meta = ReadMeta(*m_file, transaction);
  const SealFile::Slots seals = m_seal.Read();
  if (seals.Newest() > transaction) ThrowLostCommit(transaction);
  if (!meta) Throw("the meta page of the newest commit is damaged; restore the space from a backup");
  KnownStatePtr known;
  {
    const std::lock_guard lock(m_mutex);
    known = m_known;
  }
  const bool isKnown = known != nullptr && known->state->transaction() == transaction;
  const std::optional<CommitSeal> seal = seals.Of(transaction);
  if (!isKnown && !seal) {
    known = CheckUnsealed(*meta);
  } else {
    const CommitSeal expected =
        isKnown ? CommitSeal{transaction, known->state->rootsDigest, known->state->freeDigest} : *seal;
    const bool wasDoubted = isKnown && !known->doubt.empty();
    if (!wasDoubted) {
      auto read = std::make_shared<KnownState>(*Read(*meta));
      CheckSealed(*read->state, expected);
      if (read->doubt.empty() && read->state->freeDigest != expected.freeDigest) {
        read->doubt = "the list of free pages is not the one that was committed";
      }
      known = isKnown && read->doubt.empty() ? known : std::move(read);
      if (!isKnown) Remember(known);
    }
  }
  if (!known->doubt.empty()) {
    Throw("nothing can be written, since data could be lost by it: " + known->doubt +
          "; run vemo verify, and restore the space from a backup");
  }
  // Its seal could not be written when it was committed. Where the write of the next meta page fails too, LMDB leaves roots of the failed commit under
  // the number of an older one, which only a seal tells from a damaged number.
  if (!seal) m_seal.Write(CommitSeal{transaction, known->state->rootsDigest, known->state->freeDigest});
  return known;
}

void SealedSpace::Committed(std::uint64_t transaction) noexcept {
  try {
    const std::optional<MetaPage> meta = ReadMeta(*m_file, transaction);
    if (!meta) return;
    const KnownStatePtr known = Remember(Read(*meta));
    if (!known->doubt.empty()) return;
    m_seal.Write(CommitSeal{transaction, known->state->rootsDigest, known->state->freeDigest});
  } catch (const std::exception&) {
    // What was committed stays so. Whoever reads it next finds it without a seal and checks it.
  }
}

}  // namespace vemo
