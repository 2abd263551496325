// What libkestrova_host.so shares with the JNI libraries of the app.
//
// The host library is one of several shared libraries in an app, and each of
// them carries its own copy of the C++ runtime (LLVM's libc++, linked
// statically as the NDK's c++_static is). An exception object made by one
// copy cannot be caught by type in another: its std::exception is a different
// type there, so only catch (...) would see it. The layer is therefore split
// in two:
//   - KESTROVA_JNI_API marks what the host library exports: the layer's
//     process-wide state (the VM and each thread's environment), the base of
//     every peer, the natives of the host's own Java classes and the fatal
//     assertion. None of it throws.
//   - Everything that may throw (lookups, conversions, the crossing between
//     Java and C++ exceptions) is the static library kestrova_jni, compiled
//     into every library that uses it with that library's own runtime, so an
//     exception is thrown and caught by the same copy.
// A library that calls into another across a virtual interface (a peer's
// destructor, the store of host/keystash) gets no exception back either:
// see host/keystash/Future.h for how a store's failures cross.
#pragma once

#define KESTROVA_JNI_API __attribute__((visibility("default")))
