// Version words and the rules that compare them across release branches. A version word holds
// the major version as two decimal digits in its top byte, the minor version in bits 20 to 23,
// and orders builds below; versions of one branch compare as plain numbers.
#pragma once

#include <cstdint>

// True when data saved by `saved` predates the change made in `mutation` and must be converted.
// Versions of one branch compare as numbers; across the branches of the host's line the
// branch table maps a change made on an older branch to the build of the newer branch that
// carried it. The two-argument form judges for the running application's version.
bool VersionShouldMutate(uint32_t saved, uint32_t mutation);
bool VersionShouldMutate(uint32_t saved, uint32_t mutation, uint32_t current);

// The version of the running application's branch equivalent to `version` of the branch before
// it; any other version comes back unchanged.
uint32_t GetBranchCompatibleVersion(uint32_t version);
uint32_t GetBranchCompatibleVersion(uint32_t version, uint32_t current);
