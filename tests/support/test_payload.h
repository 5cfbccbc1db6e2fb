// Payloads made from numbers, so that a test can tell which one it found.
#pragma once

#include <cstdint>

namespace vemo::test {

// Make(n) builds a payload that Number() recognises; different numbers give payloads of different records.
// Specialised beside each payload type that tests use.
template <class Payload>
struct PayloadNumber;

}  // namespace vemo::test
