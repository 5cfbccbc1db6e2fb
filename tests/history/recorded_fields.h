// The three maps of a recorder in a space in memory, and what is in them as text.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>

#include "history/recorder.h"
#include "history/replay.h"
#include "store/snapshot.h"
#include "store/transaction.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {

// Sites are letters in these tests.
Guid Site(char name);
FieldId Field(std::uint64_t object, Path::Element step = 0);

// Runs as "A0-4@10 B7@15": the numbers of the elements, at the position of the first.
std::string RunsText(const VectorInsertions::List& runs);
std::string RunsText(const VectorDeletions& runs);

// Adds a run of `n` elements behind the last one, as if `first` and the operations after it had inserted
// them.
void AppendRun(VectorInsertions& insertions, const Opid& first, ssize_t n);
// Adds a run of deleted elements behind the last one in the list.
void AppendRun(VectorDeletions& deletions, const Opid& first, ssize_t q, ssize_t n);

// The bytes of every payload under the name of its map and its field.
using PayloadBytes = std::map<std::string, Bytes>;

template <class Map>
void AddPayloadBytes(const Map& map, const std::string& name, PayloadBytes& bytes) {
  for (const auto& [field, payload] : map) bytes[name + " " + FieldIdText(field)] = ToBytes(payload);
}

// Of all three maps, as the newest commit has them. All of them must exist.
PayloadBytes CommittedBytes(CSpace& space);

// A space with a transaction that is open and a recorder on it.
class RecordingSpace {
 public:
  RecordingSpace() : m_space(CSpace::Open("memory:")) { Begin(); }

  CSpace& space() { return *m_space; }
  WriteTransaction& transaction() { return *m_transaction; }
  Recorder& recorder() { return *m_recorder; }
  SiteNumbers& numbers() { return m_numbers; }
  FieldIdToVectorInsertionsMap& insertions() {
    return m_transaction->Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot);
  }
  FieldIdToVectorTombstonesMap& tombstones() {
    return m_transaction->Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot);
  }
  FieldIdToVectorInsertionsAndDeletionsMap& history() {
    return m_transaction->Root<FieldIdToVectorInsertionsAndDeletionsMap>(kHistoryRoot);
  }

  void Begin();
  void Settle() { m_recorder->Settle(); }
  // Settles and commits; the next transaction is open then, with a recorder that remembers nothing.
  void Commit();
  // Drops what was not committed. The numbers that sites have taken stay.
  void Abort();

  // Ends the transaction without committing and hands the space over.
  std::unique_ptr<CSpace> Release();

  // Settles, and returns what the maps hold.
  PayloadBytes Contents();

 private:
  std::unique_ptr<CSpace> m_space;
  SiteNumbers m_numbers;
  std::optional<WriteTransaction> m_transaction;
  std::optional<Recorder> m_recorder;
};

}  // namespace vemo::test
