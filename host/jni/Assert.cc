#include "host/jni/Assert.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <vector>

#include <glog/logging.h>

namespace kestrova {

void assertInternal(const char* format, ...) {
  va_list args;
  va_start(args, format);
  va_list copy;
  va_copy(copy, args);
  int length = std::vsnprintf(nullptr, 0, format, copy);
  va_end(copy);
  std::vector<char> message(length > 0 ? static_cast<size_t>(length) + 1 : 1, '\0');
  if (length > 0) {
    std::vsnprintf(message.data(), message.size(), format, args);
  }
  va_end(args);
  LOG(FATAL) << message.data();
  std::abort();  // not reached
}

}  // namespace kestrova
