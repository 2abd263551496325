// Visibility of the JNI support layer's public declarations.
//
// The layer lives in libkestrova_host.so and is used by other JNI libraries
// that hide everything of their own. Classes whose type information must be
// shared across those libraries (exceptions thrown in one library and caught
// in another, peers destroyed through a virtual destructor) are marked with
// KESTROVA_JNI_API so that every library refers to the one definition here.
#pragma once

#define KESTROVA_JNI_API __attribute__((visibility("default")))
