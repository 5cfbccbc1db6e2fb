// A recorded session in a space in memory: replayed and compared with the session.
#include <vemo/history.h>

#include <iostream>

using namespace vemo;

int main(int, char** arguments) {
  const auto space = CSpace::Open("memory:", {.create = true});
  const auto session = OpenTrace(arguments[1], FieldId{OID(1), Path{0}}, "author");
  const bool some = Replay(*space, *session, {}).editsApplied > 0;
  std::cout << (some ? "edits applied" : "nothing applied") << '\n'
            << CheckReplay(*space, *session).value_or("content matches") << '\n';
}
