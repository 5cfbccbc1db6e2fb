// The identity of an author.
#pragma once

#include <string_view>

#include "platform/guid.h"

namespace vemo {

// The site of the author with this text, such as "Name <address>": a name-based UUID (version 5) in a
// namespace of our own, so that the same author is the same site in every replay and in every repository.
Guid SiteOfAuthor(std::string_view author);

}  // namespace vemo
