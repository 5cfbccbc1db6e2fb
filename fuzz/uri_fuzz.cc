// Names of spaces and of fields: read or refused, and what was read is written as a name of the same.
#include <cstdlib>
#include <string_view>

#include "platform/error.h"
#include "platform/field_id.h"
#include "store/uri.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace vemo;
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  try {
    const SpaceUri uri = ParseSpaceUri(text);
    const SpaceUri again = ParseSpaceUri(SpaceUriText(uri));
    if (again.engine != uri.engine || again.path != uri.path || again.mapBytes != uri.mapBytes ||
        again.syncEachCommit != uri.syncEachCommit) {
      std::abort();
    }
  } catch (const UsageError&) {
    // refused
  }
  try {
    if (FieldIdText(ParseFieldId(text)) != text) std::abort();
  } catch (const UsageError&) {
    // refused
  }
  return 0;
}
