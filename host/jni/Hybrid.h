// Native peers of Java objects.
//
// A peer is a C++ object derived from BaseHybridClass whose address is kept in
// the "mNativePointer" field (a long) of a Java com.kestrova.jni.HybridData
// .Destructor. The Java side owns the peer from the moment it is attached:
// when the destructor object runs (HybridData.resetNative(), or the object
// becoming unreachable) the layer deletes the peer through its virtual
// destructor. Native code never deletes an attached peer itself.
//
// The address is stored as the signed pointer-sized integer widened to 64
// bits; 0 means that no peer is attached. The stored address is always that
// of the BaseHybridClass subobject, so HybridClass<T>::fromNativePointer can
// get back to T without run-time type information.
//
// All functions use the calling thread's environment and raise Java failures
// as JniException. BaseHybridClass is defined once, in libkestrova_host.so;
// the HybridData helpers are compiled into each library (see Api.h).
#pragma once

#include <jni.h>

#include <cstdint>
#include <memory>

#include "host/jni/Api.h"
#include "host/jni/References.h"

namespace kestrova::jni {

class KESTROVA_JNI_API BaseHybridClass {
 public:
  virtual ~BaseHybridClass();

  BaseHybridClass(const BaseHybridClass&) = delete;
  BaseHybridClass& operator=(const BaseHybridClass&) = delete;

 protected:
  BaseHybridClass() = default;
};

namespace detail {

inline jlong toNativePointer(BaseHybridClass* peer) noexcept {
  return static_cast<jlong>(reinterpret_cast<intptr_t>(peer));
}

inline BaseHybridClass* peerFromNativePointer(jlong nativePointer) noexcept {
  return reinterpret_cast<BaseHybridClass*>(static_cast<intptr_t>(nativePointer));
}

// Access to com.kestrova.jni.HybridData and its Destructor.
class HybridData {
 public:
  // A new HybridData with its destructor object; no peer attached.
  static LocalRef<jobject> create();

  // The "mDestructor" of a HybridData object.
  static LocalRef<jobject> getDestructor(jobject hybridData);

  // "mNativePointer" of a destructor object.
  static jlong getNativePointer(jobject destructor);

  // Attaches `peer` to `destructor`, which then owns it. Attaching a peer to
  // a destructor that already holds one is a programming error and aborts
  // the process through assertInternal.
  static void setNativePointer(jobject destructor, std::unique_ptr<BaseHybridClass> peer);
};

}  // namespace detail

template <typename T, typename Base = BaseHybridClass>
class HybridClass : public Base {
 public:
  using Base::Base;

  // The peer at `nativePointer`, a non-zero value of "mNativePointer" that
  // was written for a T.
  static T* fromNativePointer(jlong nativePointer) noexcept {
    return static_cast<T*>(detail::peerFromNativePointer(nativePointer));
  }
};

}  // namespace kestrova::jni
