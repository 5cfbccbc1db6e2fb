// Runs the campaign of damage to the engine's own files: file_campaign file_damage [--seed N] [--OPTION N]... A program of its own, since it is
// built from the tests of the engines and not from those of the store.
#include "tests/campaigns/campaign_program.h"
#include "tests/campaigns/file_damage.h"

namespace {

void Take(vemo::campaign::Numbers& numbers, vemo::campaign::FileDamageOptions& options) {
  numbers.Take("damages", options.damages);
  numbers.Take("damages-per-space", options.damagesPerSpace);
  numbers.Take("rollback", options.rollback);
}

}  // namespace

int main(int argc, char** argv) {
  using namespace vemo::campaign;
  return RunProgram([=] { return RunCampaign(MakeCampaign(RunFileDamage, Take), argc, argv); });
}
