// Whether this process is a copy, made by fork, of one that had the driver open.
#pragma once

namespace android {

// Such a copy shares its parent's connections. Whatever it said on them would be said in the parent's name, and its
// locks are as the parent's other threads left them: so it says nothing, not even when it exits.
bool isForked();

// From now on copies are told from the original.
void watchForForks();

}  // namespace android
