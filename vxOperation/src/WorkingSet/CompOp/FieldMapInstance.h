// Making an instance of the field map: three classes and the names that go with them.
#pragma once

#include <array>

#include "vxOperation/src/WorkingSet/CompOp/FieldMap.h"
#include "vxPersistStore/Reflection.h"

// VEMO_FIELD_MAP_INSTANCE(Name, PayloadType, Capacity) declares, in the namespace where it stands (vemo):
//   classes Name, NameInternalNode, NameLeafNode; NameLeafKeyEntry, NameInternalKeyEntry; their schema constants;
//   the helpers through which the generic code builds and moves keys, payloads and entries;
//   _GetReflected and _Register_ of the three classes, defined by VEMO_FIELD_MAP_REGISTRATION in one source file.
// It is a macro because the names of the classes are names of the format (reflected names, assertion texts) and of the API.
#define VEMO_FIELD_MAP_INSTANCE(Name, PayloadType, Capacity)                                                         \
  class Name;                                                                                                        \
  class Name##InternalNode;                                                                                          \
  class Name##LeafNode;                                                                                              \
  inline constexpr int Name##_SCHEMA = 1;                                                                            \
  inline constexpr int Name##InternalNode_SCHEMA = 1;                                                                \
  inline constexpr int Name##LeafNode_SCHEMA = 1;                                                                    \
  using Name##LeafKeyEntry = ::std::pair<const ::vemo::FieldId, PayloadType>;                                        \
  using Name##InternalKeyEntry = ::vemo::FieldMapInternalKeyEntry;                                                   \
  const ::vemo::ReflectedClass& _GetReflected(const Name*);                                                          \
  const ::vemo::ReflectedClass& _GetReflected(const Name##InternalNode*);                                            \
  const ::vemo::ReflectedClass& _GetReflected(const Name##LeafNode*);                                                \
  void _Register_##Name();                                                                                           \
  void _Register_##Name##InternalNode();                                                                             \
  void _Register_##Name##LeafNode();                                                                                 \
  Name##LeafNode* Name##AsLeafNode(void* node) noexcept;                                                             \
  Name##InternalNode* Name##AsInternalNode(void* node) noexcept;                                                     \
                                                                                                                     \
  /* Copy-constructs a key, default-constructs a payload, relocates a key: each into raw storage. */                 \
  inline void Name##CopyConstructKey(void* raw, const ::vemo::FieldId& key) { ::new (raw)::vemo::FieldId(key); }     \
  inline void Name##ConstructPayload(void* raw) noexcept { ::new (raw) PayloadType(); }                              \
  inline void Name##MoveKey(void* raw, ::vemo::FieldId* source) noexcept {                                           \
    ::vemo::Relocate(static_cast<::vemo::FieldId*>(raw), source, 1);                                                 \
  }                                                                                                                  \
                                                                                                                     \
  struct Name##Traits {                                                                                              \
    using Map = Name;                                                                                                \
    using InternalNode = Name##InternalNode;                                                                         \
    using LeafNode = Name##LeafNode;                                                                                 \
    using Payload = PayloadType;                                                                                     \
    static constexpr ::vemo::ssize_t kCapacity = Capacity;                                                           \
    static constexpr int kMapSchema = Name##_SCHEMA;                                                                 \
    static constexpr int kInternalNodeSchema = Name##InternalNode_SCHEMA;                                            \
    static constexpr int kLeafNodeSchema = Name##LeafNode_SCHEMA;                                                    \
    static constexpr const char* kBoundInLeafText = "0 <= j && j <= " #Name "AsLeafNode(node)->m_numKeyEntrys";       \
    static LeafNode* AsLeafNode(void* node) noexcept { return Name##AsLeafNode(node); }                              \
    static InternalNode* AsInternalNode(void* node) noexcept { return Name##AsInternalNode(node); }                  \
    static void CopyConstructKey(void* raw, const ::vemo::FieldId& key) { Name##CopyConstructKey(raw, key); }        \
    static void ConstructPayload(void* raw) noexcept { Name##ConstructPayload(raw); }                                \
    static void MoveKey(void* raw, ::vemo::FieldId* source) noexcept { Name##MoveKey(raw, source); }                 \
    static const ::vemo::ReflectedClass* GetReflectedMap();                                                          \
    static const ::vemo::ReflectedClass* GetReflectedInternalNode();                                                 \
    static const ::vemo::ReflectedClass* GetReflectedLeafNode();                                                     \
  };                                                                                                                 \
                                                                                                                     \
  class Name final : public ::vemo::TFieldMap<Name##Traits> {                                                        \
   public:                                                                                                           \
    Name() = default;                                                                                                \
    Name(const Name&) = default;                                                                                     \
    Name& operator=(const Name& other) { return TFieldMap::operator=(other); }                                       \
    Name(Name&& other) : TFieldMap(static_cast<TFieldMap&&>(other)) {}                                               \
    Name& operator=(Name&& other) { return TFieldMap::operator=(static_cast<TFieldMap&&>(other)); }                  \
  };                                                                                                                 \
  class Name##InternalNode final : public ::vemo::TFieldMapInternalNode<Name##Traits> {};                            \
  class Name##LeafNode final : public ::vemo::TFieldMapLeafNode<Name##Traits> {};                                    \
                                                                                                                     \
  /* An untyped child pointer as the node that the caller knows it to be; nothing is checked. */                     \
  inline Name##LeafNode* Name##AsLeafNode(void* node) noexcept { return static_cast<Name##LeafNode*>(node); }        \
  inline Name##InternalNode* Name##AsInternalNode(void* node) noexcept {                                             \
    return static_cast<Name##InternalNode*>(node);                                                                   \
  }                                                                                                                  \
  inline const ::vemo::ReflectedClass* Name##Traits::GetReflectedMap() {                                             \
    return &_GetReflected(static_cast<const Name*>(nullptr));                                                        \
  }                                                                                                                  \
  inline const ::vemo::ReflectedClass* Name##Traits::GetReflectedInternalNode() {                                    \
    return &_GetReflected(static_cast<const Name##InternalNode*>(nullptr));                                          \
  }                                                                                                                  \
  inline const ::vemo::ReflectedClass* Name##Traits::GetReflectedLeafNode() {                                        \
    return &_GetReflected(static_cast<const Name##LeafNode*>(nullptr));                                              \
  }

// The reflection record of one class, built once on first use, and its registration under "vemo::Class".
#define VEMO_REFLECTED_CLASS(Class)                                                                                  \
  const ReflectedClass& _GetReflected(const Class*) {                                                                \
    static std::array<ConstStringZ, 2> interfaces = {"vemo::IObject", "vemo::IPersistable"};                         \
    static const ReflectedClass reflected = MakeReflectedClass<Class>("vemo::" #Class, interfaces);                  \
    return reflected;                                                                                                \
  }                                                                                                                  \
  void _Register_##Class() {                                                                                         \
    const ReflectedClass& reflected = _GetReflected(static_cast<const Class*>(nullptr));                             \
    XTarget& target = Vemo_vxOperation_GetXTarget();                                                                 \
    VEMO_VERIFY_TEXT(RegisterReflectedClass(&reflected, target) == NSE_OK,                                           \
                     "vemo::RegisterReflectedClass(&_GetReflected( (" #Class                                         \
                     "*) 0),vemo::Vemo_vxOperation_GetXTarget()) == vemo::NSE_OK");                                  \
  }

#define VEMO_FIELD_MAP_REGISTRATION(Name) \
  VEMO_REFLECTED_CLASS(Name)              \
  VEMO_REFLECTED_CLASS(Name##InternalNode) \
  VEMO_REFLECTED_CLASS(Name##LeafNode)

namespace vemo {

// The record of class T, and the type operations in it.
template <class T>
const ReflectedClass* GetReflectedClass() {
  return &_GetReflected(static_cast<const T*>(nullptr));
}
template <class T>
const TypeOps* _GetTypeOps(const T*) {
  return &_GetReflected(static_cast<const T*>(nullptr)).m_ops;
}

}  // namespace vemo
