// Conversions between Java's UTF-16 strings and standard UTF-8 byte strings.
//
// Strings cross the JNI boundary as standard UTF-8, not JNI's modified UTF-8:
// U+0000 is one zero byte and a code point beyond U+FFFF is four bytes. An
// unpaired surrogate becomes U+FFFD. In the other direction every byte that
// does not start a well-formed UTF-8 sequence (overlong forms, encoded
// surrogates and values beyond U+10FFFF included) becomes one U+FFFD.
//
// Pure functions; safe on any thread.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>


namespace kestrova::jni {

std::string utf16ToUtf8(std::u16string_view text);

std::u16string utf8ToUtf16(std::string_view text);

}  // namespace kestrova::jni
