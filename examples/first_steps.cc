#include <iostream>
#include <vemo/store.h>
using namespace vemo;
int main() {
  const FieldId field{OID(1), Path{0, 3}};  // field 1:0.3 of your data
  {
    auto space = CSpace::Open("lmdb:first-steps", {.create = true});
    WriteTransaction txn(*space);
    txn.Root<FieldIdToVectorTombstonesMap>("tombstones")[field].Erasep(4, 3);  // elements 4, 5 and 6 are deleted
    txn.Commit();                                                             // durable from here on
  }
  auto space = CSpace::Open("lmdb:first-steps");
  Snapshot snapshot(*space);
  const auto* found = snapshot.Root<FieldIdToVectorTombstonesMap>("tombstones").rFind(field);
  std::cout << "position 5 is " << (found->Exists(5) ? "live" : "a tombstone") << '\n';
}
