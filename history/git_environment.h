// The environment that git is run in.
#pragma once

#include <string>
#include <vector>

namespace vemo {

// This process's environment as NAME=VALUE, without what would lead git to another repository or change what
// it prints, and with English messages. Where git and its configuration lie stays: the repository's owner may
// have to be declared safe there, and the commands override every setting that matters.
std::vector<std::string> GitEnvironment();

}  // namespace vemo
