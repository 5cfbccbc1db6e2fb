#include "history/site.h"

#include <uuid/uuid.h>

#include <algorithm>
#include <array>

namespace vemo {

namespace {

// 5d7522db-bab7-4b02-9d92-80ade0ec004e, random. It may never change: the sites of stored edits are made from
// it.
constexpr uuid_t kAuthors = {0x5d, 0x75, 0x22, 0xdb, 0xba, 0xb7, 0x4b, 0x02,
                             0x9d, 0x92, 0x80, 0xad, 0xe0, 0xec, 0x00, 0x4e};

}  // namespace

Guid SiteOfAuthor(std::string_view author) {
  uuid_t uuid;
  uuid_generate_sha1(uuid, kAuthors, author.data(), author.size());
  std::array<std::uint8_t, 16> bytes;
  std::copy(std::begin(uuid), std::end(uuid), bytes.begin());
  return GuidFromNetworkBytes(bytes);
}

}  // namespace vemo
