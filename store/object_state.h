// What every persistent object carries for the store: its space, its flags and its id.
#pragma once

#include "vxPersistStore/pref.h"

namespace vemo {

// Bits of ObjSysState::objflags_ that the store uses beside the dirty flag.
inline constexpr int kSnapshotFlag = 2;  // the object belongs to a snapshot and must not be marked
inline constexpr int kDeletedFlag = 3;   // the object was deleted in the open transaction

ObjSysState& SysStateOf(ptr<const IPersistable> object) noexcept;
PersistObjState& PersistStateOf(ptr<const IPersistable> object) noexcept;

// Clears the dirty flag, tells the object that it is collected, and ends it.
void DestroyObject(ptr<IPersistable> object) noexcept;

}  // namespace vemo
