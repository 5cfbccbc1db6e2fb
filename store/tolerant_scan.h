// Scanning the records of a space whose engine cannot read all of them.
#pragma once

#include <functional>
#include <optional>
#include <string>

#include "store/engine.h"

namespace vemo {

// Calls `visit` for each record that can be read, in ascending order of ids. Where the engine throws, `fault` is told from which
// id on and why; ids behind it are then asked for one by one until the scan works again, at most `kLongestGap` of them. `visit`
// must not throw a StoreError of its own.
void ScanReadableRecords(const EngineSnapshot& state, const std::function<void(OID, ByteView)>& visit,
                         const std::function<void(OID, const std::string&)>& fault);

inline constexpr std::uint64_t kLongestGap = 1u << 20;

// The record of `oid`, nothing where there is none. Where the engine throws, nothing, and `fault` says why.
std::optional<ByteView> ReadOrFault(const EngineSnapshot& state, OID oid, std::string& fault);

// Calls `visit` for each value of the table that can be read. Returns why the engine could not go on, if it could not.
std::optional<std::string> ScanReadableNamed(const EngineSnapshot& state, NamedTable table,
                                             const std::function<void(std::string_view, ByteView)>& visit);

}  // namespace vemo
