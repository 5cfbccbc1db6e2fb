#include "store/node_blocks.h"

#include <new>

#include "store/object_state.h"

namespace vemo {

namespace {

// AddressSanitizer is to see each object by itself.
#if defined(__SANITIZE_ADDRESS__)
constexpr bool kKeepsBlocks = false;
#elif defined(__has_feature)
constexpr bool kKeepsBlocks = !__has_feature(address_sanitizer);
#else
constexpr bool kKeepsBlocks = true;
#endif

std::size_t SizeOf(const ClassEntry& classEntry) noexcept { return static_cast<std::size_t>(classEntry.reflected->m_size); }

}  // namespace

ptr<IPersistable> NodeBlocks::Create(const ClassEntry& classEntry) {
  Block*& first = First(classEntry);
  if (first == nullptr) return {classEntry.reflected->m_createFn().m_self, classEntry.table};
  void* memory = first;
  first = first->next;
  m_bytes -= SizeOf(classEntry);
  classEntry.reflected->m_ops.m_ConstructArrayFn(memory, 0, 1);
  return {memory, classEntry.table};
}

void NodeBlocks::End(ptr<IPersistable> object, std::size_t mostBytes) noexcept {
  const ClassEntry& classEntry = *FindClass(object.Table());
  if (!kKeepsBlocks || m_bytes + SizeOf(classEntry) > mostBytes) {
    DestroyObject(object);
    return;
  }
  PrepareToEnd(object);
  classEntry.reflected->m_ops.m_DestructArrayFn(object.m_self, 0, 1);
  Block*& first = First(classEntry);
  first = ::new (object.m_self) Block{first};
  m_bytes += SizeOf(classEntry);
}

void NodeBlocks::Clear() noexcept {
  for (Block*& first : m_first) {
    while (first != nullptr) {
      Block* next = first->next;
      ::operator delete(first);
      first = next;
    }
  }
  m_bytes = 0;
}

}  // namespace vemo
