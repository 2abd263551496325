// The base of every peer, kept in libkestrova_host.so: the one place its
// virtual destructor (and so its type information) is defined.
#include "host/jni/Hybrid.h"

namespace kestrova::jni {

BaseHybridClass::~BaseHybridClass() = default;

}  // namespace kestrova::jni
