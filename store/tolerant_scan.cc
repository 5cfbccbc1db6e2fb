#include "store/tolerant_scan.h"

namespace vemo {

namespace {

// How many ids are asked for one by one before the scan is tried again.
constexpr std::uint64_t kProbes = 64;

}  // namespace

void ScanReadableRecords(const EngineSnapshot& state, const std::function<void(OID, ByteView)>& visit,
                         const std::function<void(OID, const std::string&)>& fault) {
  OID next(1);
  std::uint64_t gap = 0;  // ids asked for since the scan last came forward
  while (gap <= kLongestGap) {
    try {
      state.ScanRecords(next, [&](OID oid, ByteView record) {
        visit(oid, record);
        next = OID(oid.m_value + 1);
        gap = 0;
        return true;
      });
      return;
    } catch (const StoreError& error) {
      if (gap == 0) fault(next, error.what());
    }
    for (std::uint64_t i = 0; i < kProbes; ++i, ++gap, next = OID(next.m_value + 1)) {
      std::string ignored;
      if (const std::optional<ByteView> record = ReadOrFault(state, next, ignored)) visit(next, *record);
    }
  }
}

std::optional<ByteView> ReadOrFault(const EngineSnapshot& state, OID oid, std::string& fault) {
  try {
    return state.Read(oid);
  } catch (const StoreError& error) {
    fault = error.what();
    return std::nullopt;
  }
}

std::optional<std::string> ScanReadableNamed(const EngineSnapshot& state, NamedTable table,
                                             const std::function<void(std::string_view, ByteView)>& visit) {
  try {
    state.ScanNamed(table, "", [&](std::string_view name, ByteView bytes) {
      visit(name, bytes);
      return true;
    });
    return std::nullopt;
  } catch (const StoreError& error) {
    return error.what();
  }
}

}  // namespace vemo
