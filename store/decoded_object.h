// Looking at stored objects without keeping them.
#pragma once

#include <string>
#include <utility>

#include "store/class_registry.h"
#include "store/view.h"

namespace vemo {

// An object that was read for a look and belongs to nobody else: it is no resident of any view, and ends with its holder.
// Following one of its references would load the object named into the view, so readers go by the ids alone.
class DecodedObject {
 public:
  DecodedObject() noexcept = default;
  explicit DecodedObject(ptr<IPersistable> object) noexcept : m_object(object) {}
  DecodedObject(DecodedObject&& other) noexcept : m_object(std::exchange(other.m_object, {})) {}
  DecodedObject& operator=(DecodedObject&& other) noexcept {
    std::swap(m_object, other.m_object);
    return *this;
  }
  ~DecodedObject() {
    if (m_object.m_self != nullptr) DestroyObject(m_object);
  }

  ptr<IPersistable> Get() const noexcept { return m_object; }
  template <class T>
  const T& As() const noexcept {
    return *static_cast<const T*>(m_object.m_self);
  }

 private:
  ptr<IPersistable> m_object;
};

// Reads nodes of a view's maps. Throws what View::Resolve throws for the same record.
class NodeReader {
 public:
  explicit NodeReader(View& view) noexcept : m_view(view) {}

  // The node behind a reference that is not empty, as it is stored. Throws CorruptRecord where it is of another class than
  // `expected`.
  DecodedObject Read(const prefbase& reference, const IPersistable::FnTable* expected) const {
    DecodedObject object(m_view.Decode(reference.m_oid, m_view.RequireRecord(reference.m_oid, expected), expected));
    if (object.Get().Table() != expected) m_view.RefuseClass(reference.m_oid, object.Get().Table(), expected);
    return object;
  }

 private:
  View& m_view;
};

}  // namespace vemo
