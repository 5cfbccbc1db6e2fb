// What a host was asked to do, in order, and its text for comparisons with literals.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "platform/oid.h"

namespace vemo::test {

enum class HostCall {
  // Lifecycle of objects.
  kRegister,
  kReach,
  kDirty,
  kDelete,
  kDeleteTree,
  kCollect,
  kInterrupted,
  // References.
  kSet,
  kClear,
  kLoad,
  // Registration of classes.
  kTarget,
  kRegisterClass,
};

struct Call {
  HostCall m_operation;
  OID m_object;  // null for an object without an id, such as a map on the stack
  OID m_other;
  std::string m_text;  // one line without its end: the operation and the names of its objects
};

class CallLog {
 public:
  void Append(Call call) { m_calls.push_back(std::move(call)); }
  void Clear() { m_calls.clear(); }
  const std::vector<Call>& calls() const { return m_calls; }

  // The calls that concern the life of objects, one a line: "dirty map\nregister leaf2\nreach leaf1 leaf2\n".
  std::string LifecycleText() const;
  // The same with the calls on references among them: "set leaf2\n".
  std::string FullText() const;
  std::string RegistrationText() const;
  int Count(HostCall operation) const;

 private:
  std::string TextOf(const std::function<bool(HostCall)>& wanted) const;

  std::vector<Call> m_calls;
};

}  // namespace vemo::test
