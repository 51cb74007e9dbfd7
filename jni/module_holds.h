#ifndef VOK_JNI_MODULE_HOLDS_H
#define VOK_JNI_MODULE_HOLDS_H

// How many calls hold each registered entry, and which removed entries wait
// for their last call to return before they are unloaded.

#include "vok_registry.h"

// Takes one hold; called with the registry's monitor held, so that a hold is
// either taken before disconnect removes the entry or not at all. False when
// the hold could not be recorded (out of memory): the caller treats the entry
// as not found.
bool holdModuleEntry(ModuleEntry* entry) noexcept;
void releaseModuleEntry(ModuleEntry* entry) noexcept;

#endif
