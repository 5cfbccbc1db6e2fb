// A space in LMDB: written, read anew, checked.
#include <store/verify.h>
#include <vemo/store.h>

#include <iostream>

using namespace vemo;

int main(int, char** arguments) {
  const FieldId field{OID(1), Path{0, 3}};
  const std::string uri = std::string("lmdb:") + arguments[1];
  {
    const auto space = CSpace::Open(uri, {.create = true});
    WriteTransaction transaction(*space);
    transaction.Root<FieldIdToVectorTombstonesMap>("tombstones")[field].Erasep(4, 3);
    transaction.Commit();
  }
  const auto space = CSpace::Open(uri);
  Snapshot snapshot(*space);
  std::cout << ToText(*snapshot.Root<FieldIdToVectorTombstonesMap>("tombstones").rFind(field)) << '\n'
            << "findings: " << VerifySpace(snapshot).findings.size() << '\n';
  try {
    CSpace::Open("lmdb:no-such-folder");
  } catch (const SpaceNotFound&) {
    std::cout << "errors arrive by their types\n";
  }
}
