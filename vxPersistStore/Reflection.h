// Reflection records: what the store knows of a class before it has an object of it.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>

#include "platform/object_store.h"
#include "platform/types.h"
#include "vxPersistStore/IPersistable.h"

namespace vemo {

using ConstStringZ = const char*;
using CreateClassVariableFn = ptr<IObject> (*)();

struct ReflectedField {
  ConstStringZ m_name;
  ssize_t m_offset;
  const std::uint8_t* m_bc;
};
struct ReflectedModelField;
struct ReflectedDepField;
struct ReflectedClassMethod;

// Operations on arrays of objects that lie `stride` bytes apart. Null means that the class does not offer one.
struct TypeOps {
  using ConstructArrayFn = void (*)(void* p, ssize_t stride, ssize_t count);
  using CopyArrayFn = void (*)(void* p, ssize_t stride, const void* src, ssize_t srcStride, ssize_t count);
  using UnusedFn = void (*)();

  ssize_t m_size = 0;
  UnusedFn m_equalsFn = nullptr;
  UnusedFn m_lessFn = nullptr;
  UnusedFn m_PrintVariableFn = nullptr;
  ConstructArrayFn m_ConstructArrayFn = nullptr;
  CopyArrayFn m_CopyConstructArrayFn = nullptr;
  CopyArrayFn m_AssignArrayFn = nullptr;
  ConstructArrayFn m_DestructArrayFn = nullptr;
  UnusedFn m_SerialiseArrayFn = nullptr;
  UnusedFn m_DeserialiseArrayFn = nullptr;
  UnusedFn m_VisitObjectsInArrayFn = nullptr;
  UnusedFn m_VisitPrefsInArrayFn = nullptr;
  UnusedFn m_LowerBoundFn = nullptr;
  UnusedFn m_UpperBoundFn = nullptr;
  UnusedFn m_ConstructVariableFromSelfFn = nullptr;
  UnusedFn m_ConstructSelfFromVariableFn = nullptr;
  UnusedFn m_AssignVariableFromSelfFn = nullptr;
  UnusedFn m_AssignSelfFromVariableFn = nullptr;
};

struct ReflectedClass {
  std::uint32_t m_flags = 0;
  ConstStringZ m_name = nullptr;
  ssize_t m_size = 0;
  const std::uint8_t* m_metaData = nullptr;
  const ReflectedField* m_fields = nullptr;
  ssize_t m_numFields = 0;
  const ReflectedModelField* m_modelFields = nullptr;
  ssize_t m_numModelFields = 0;
  const ReflectedDepField* m_depFields = nullptr;
  ssize_t m_numDepFields = 0;
  const ReflectedClassMethod* m_methods = nullptr;
  ssize_t m_numMethods = 0;
  const ConstStringZ* m_stringTable = nullptr;
  const ConstStringZ* m_interfaces = nullptr;
  ssize_t m_numIndirectInterfaces = 0;
  ssize_t m_numDirectInterfaces = 0;
  const IObject::FnTable* m_IObjectFnTable = nullptr;
  CreateClassVariableFn m_createFn = nullptr;
  TypeOps m_ops;
};

template <class T>
void ConstructVariable(T* p) {
  ::new (static_cast<void*>(p)) T;
}
template <class T>
void CopyConstructVariable(T* p, const T* src) {
  ::new (static_cast<void*>(p)) T(*src);
}
template <class T>
void AssignVariable(T* p, const T* src) {
  *p = *src;
}
template <class T>
void DestructVariable(T* p) {
  std::destroy_at(p);
}

// Advances `p` by `stride` bytes.
template <class T>
void ApplyStride(T*& p, ssize_t stride) {
  using Byte = std::conditional_t<std::is_const_v<T>, const std::byte, std::byte>;
  p = reinterpret_cast<T*>(reinterpret_cast<Byte*>(p) + stride);
}

template <class T>
void ConstructArray(T* p, ssize_t stride, ssize_t count) {
  for (ssize_t i = 0; i < count; ++i, ApplyStride(p, stride)) ConstructVariable(p);
}
template <class T>
void CopyConstructArray(T* p, ssize_t stride, const T* src, ssize_t srcStride, ssize_t count) {
  for (ssize_t i = 0; i < count; ++i, ApplyStride(p, stride), ApplyStride(src, srcStride)) CopyConstructVariable(p, src);
}
template <class T>
void AssignArray(T* p, ssize_t stride, const T* src, ssize_t srcStride, ssize_t count) {
  for (ssize_t i = 0; i < count; ++i, ApplyStride(p, stride), ApplyStride(src, srcStride)) AssignVariable(p, src);
}
template <class T>
void DestructArray(T* p, ssize_t stride, ssize_t count) {
  for (ssize_t i = 0; i < count; ++i, ApplyStride(p, stride)) DestructVariable(p);
}

template <class T>
TypeOps MakeTypeOps() {
  TypeOps ops;
  ops.m_size = sizeof(T);
  ops.m_ConstructArrayFn = [](void* p, ssize_t stride, ssize_t count) {
    ConstructArray(static_cast<T*>(p), stride, count);
  };
  ops.m_CopyConstructArrayFn = [](void* p, ssize_t stride, const void* src, ssize_t srcStride, ssize_t count) {
    CopyConstructArray(static_cast<T*>(p), stride, static_cast<const T*>(src), srcStride, count);
  };
  ops.m_AssignArrayFn = [](void* p, ssize_t stride, const void* src, ssize_t srcStride, ssize_t count) {
    AssignArray(static_cast<T*>(p), stride, static_cast<const T*>(src), srcStride, count);
  };
  ops.m_DestructArrayFn = [](void* p, ssize_t stride, ssize_t count) {
    DestructArray(static_cast<T*>(p), stride, count);
  };
  return ops;
}

// The record of a persistable class; `interfaces` names two interfaces and must outlive the process's use of it.
template <class T>
ReflectedClass MakeReflectedClass(ConstStringZ name, const std::array<ConstStringZ, 2>& interfaces) {
  ReflectedClass reflected;
  reflected.m_flags = 1;
  reflected.m_name = name;
  reflected.m_size = sizeof(T);
  reflected.m_interfaces = interfaces.data();
  reflected.m_numIndirectInterfaces = 1;
  reflected.m_numDirectInterfaces = 1;
  reflected.m_IObjectFnTable = IObject::Stubs<T>::GetTable();
  reflected.m_createFn = &T::sfnCreateInstance;
  reflected.m_ops = MakeTypeOps<T>();
  return reflected;
}

}  // namespace vemo
