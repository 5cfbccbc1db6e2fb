#include "store/object_state.h"

namespace vemo {

ObjSysState& SysStateOf(ptr<const IPersistable> object) noexcept {
  return *object.Table()->_IObject.GetSysState(object.m_self);
}

PersistObjState& PersistStateOf(ptr<const IPersistable> object) noexcept {
  return *object.Table()->GetPersistObjState(object.m_self);
}

void DestroyObject(ptr<IPersistable> object) noexcept {
  SysStateOf(object).ClearFlag(ObjSysState::kDirtyFlag);
  object.Table()->_IObject.OnGarbageCollect(object.m_self);
  object.Table()->_IObject.Destroy(object.m_self);
}

}  // namespace vemo
