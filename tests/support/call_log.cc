#include "tests/support/call_log.h"

#include <algorithm>

namespace vemo::test {

std::string CallLog::LifecycleText() const {
  return TextOf([](HostCall operation) { return operation <= HostCall::kInterrupted; });
}

std::string CallLog::FullText() const {
  return TextOf([](HostCall operation) { return operation <= HostCall::kLoad; });
}

std::string CallLog::RegistrationText() const {
  return TextOf([](HostCall operation) { return operation >= HostCall::kTarget; });
}

int CallLog::Count(HostCall operation) const {
  return static_cast<int>(std::count_if(m_calls.begin(), m_calls.end(),
                                        [&](const Call& call) { return call.m_operation == operation; }));
}

std::string CallLog::TextOf(const std::function<bool(HostCall)>& wanted) const {
  std::string text;
  for (const Call& call : m_calls) {
    if (wanted(call.m_operation)) text += call.m_text + '\n';
  }
  return text;
}

}  // namespace vemo::test
