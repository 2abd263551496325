// Finding and attaching the native peers of managed objects.
//
// A managed object reaches its peer in one of two ways, decided once per
// managed class: a class deriving from com.kestrova.jni.HybridClassBase holds
// the destructor object ("mDestructor") itself; any other class holds a
// com.kestrova.jni.HybridData in its field "mHybridData", whose destructor
// object holds the peer. The destructor object's "mNativePointer" is the
// peer's address (see host/jni/Hybrid.h).
//
// A missing holder or a zero address is reported as a Java
// NullPointerException with the message "java.lang.NullPointerException".
#pragma once

#include <jni.h>

#include <memory>

#include "host/jni/Hybrid.h"

namespace kestrova::reliqaclassifier {

// How the objects of one managed class reach their peers. Computed from the
// first object looked up and kept for the life of the process.
struct PeerClass {
  bool derivesFromHybridClassBase = false;
  jfieldID destructorField = nullptr;  // "mDestructor" of a deriving class
  jfieldID hybridDataField = nullptr;  // "mHybridData" of the named class otherwise

  // `object` is an instance of the class named `className`.
  static PeerClass describe(jobject object, const char* className);
};

// The address of `object`'s peer; never 0.
jlong findPeer(jobject object, const PeerClass& peerClass);

// Attaches `peer` to `destructor` (a com.kestrova.jni.HybridData$Destructor
// without a peer), which owns it from then on.
void attachPeer(jobject destructor, std::unique_ptr<jni::BaseHybridClass> peer);

}  // namespace kestrova::reliqaclassifier
