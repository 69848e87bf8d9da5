// Version rules: whether bytes saved by one version predate a change of the format, across
// release branches that were developed side by side.
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

// Alignment markers were added in this version.
constexpr uint32_t kAlignmentMarkerVersion = 0x08602000;

// The first version whose type strings can hold a record of `code` (0 for kinds as old as the
// format): writers refuse to save the kind for an earlier version, and readers refuse such a record.
uint32_t FirstVersionWithTypeCode(int32_t code);
