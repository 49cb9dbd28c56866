// The entries of a dictionary on their way in.
#pragma once

#include "platform/PropertyList.h"

namespace platform {

/// Leaves one entry a key: the last value, at the place of the first. Takes n log n steps whatever
/// the keys are, since a hash of a stranger's keys could be made to collide.
void MergeEqualKeys(PropertyList::Dictionary& entries);

}  // namespace platform
