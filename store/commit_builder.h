// Turning the objects of a transaction into one atomic batch.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "store/engine.h"
#include "store/view.h"

namespace vemo {

// What is written: every object given to Add, and every new one that these reach by VisitPrefs. New objects are not marked
// when they are made, and a split's right node never is: reaching them is what makes them part of the space.
class CommitBuilder {
 public:
  CommitBuilder(View& view, const CSpace& space, const std::unordered_set<OID>& newIds,
                const std::unordered_set<OID>& deletedIds);

  // Makes room for that many objects more, so that their records are not copied over and over while more come.
  void Reserve(std::size_t objects);

  // Adds an object and what is new below it. Throws UsageError when one of them refers to a deleted object or to an object
  // of another space or view.
  void Add(OID oid, ptr<IPersistable> object);

  // Works off up to `limit` entries of the queue of deleted subtrees: each record goes, its children join the queue. A
  // record that is missing was deleted before. One that cannot be read goes too; what was below it is left to collection.
  void SweepQueue(std::size_t limit);

  // The batch; views in it point into this object.
  CommitBatch& Finish();

  CommitBatch& Batch() noexcept { return m_batch; }
  // What is written, and how much memory each takes (Residents::Measure), taken while it was at hand.
  const std::unordered_map<OID, std::size_t>& Written() const noexcept { return m_written; }

 private:
  struct Extent {
    OID oid;
    std::size_t begin;
    std::size_t end;
  };

  void Encode(OID oid, ptr<IPersistable> object);
  std::uint32_t ClassNumber(const ClassEntry& classEntry);

  View& m_view;
  const CSpace& m_space;
  const std::unordered_set<OID>& m_newIds;
  const std::unordered_set<OID>& m_deletedIds;
  std::unordered_map<OID, std::size_t> m_written;
  Bytes m_bytes;
  std::vector<Extent> m_extents;
  CommitBatch m_batch;
};

// The ids that an object owns, in order, and where they are bound, their objects.
std::vector<prefbase> OwnedReferences(ptr<const IPersistable> object);

}  // namespace vemo
