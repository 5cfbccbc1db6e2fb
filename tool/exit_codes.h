// What the command's exit status says.
#pragma once

namespace vemo::tool {

enum ExitCode : int {
  kGood = 0,
  kFinding = 1,     // the command worked and found something wrong
  kBadInput = 2,    // bad use, or input that is not what it should be
  kStoreFault = 3,  // the store, the engine or the machine failed
};

}  // namespace vemo::tool
