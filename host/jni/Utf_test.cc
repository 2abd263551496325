#include "host/jni/Utf.h"

#include <gtest/gtest.h>

namespace kestrova::jni {
namespace {

TEST(Utf16ToUtf8, EncodesStandardUtf8NotModifiedUtf8) {
  // NUL is one zero byte; a supplementary character is four bytes, not two
  // three-byte surrogate encodings.
  EXPECT_EQ(utf16ToUtf8(std::u16string(u"a\0b", 3)), std::string("a\0b", 3));
  EXPECT_EQ(utf16ToUtf8(u"\U0001F600"), "\xF0\x9F\x98\x80");
  EXPECT_EQ(utf16ToUtf8(u"\u00E9\u20AC"), "\xC3\xA9\xE2\x82\xAC");
  EXPECT_EQ(utf16ToUtf8(u""), "");
}

TEST(Utf16ToUtf8, ReplacesUnpairedSurrogates) {
  const std::string replacement = "\xEF\xBF\xBD";
  EXPECT_EQ(utf16ToUtf8(std::u16string(1, char16_t(0xD83D))), replacement);      // lone high at end
  EXPECT_EQ(utf16ToUtf8(std::u16string{char16_t(0xDE00), u'x'}), replacement + "x");  // lone low
  EXPECT_EQ(utf16ToUtf8(std::u16string{char16_t(0xD83D), u'x'}), replacement + "x");  // high, no low
  // Two highs followed by a low: the first is unpaired, the second pairs up.
  EXPECT_EQ(utf16ToUtf8(std::u16string{char16_t(0xD83D), char16_t(0xD83D), char16_t(0xDE00)}),
            replacement + "\xF0\x9F\x98\x80");
}

TEST(Utf8ToUtf16, RoundTripsEveryKindOfCodePoint) {
  std::u16string text = u"plain \u00E9 \u20AC \U0001F600 \U0010FFFF";
  text.push_back(u'\0');
  EXPECT_EQ(utf8ToUtf16(utf16ToUtf8(text)), text);
}

TEST(Utf8ToUtf16, ReplacesEachByteOfMalformedSequences) {
  const char16_t r = 0xFFFD;
  EXPECT_EQ(utf8ToUtf16("\xC0\x80"), (std::u16string{r, r}));               // overlong NUL
  EXPECT_EQ(utf8ToUtf16("\xED\xA0\x80"), (std::u16string{r, r, r}));        // encoded surrogate
  EXPECT_EQ(utf8ToUtf16("\xF4\x90\x80\x80"), (std::u16string{r, r, r, r}));  // beyond U+10FFFF
  EXPECT_EQ(utf8ToUtf16("a\xE2\x82"), (std::u16string{u'a', r, r}));         // truncated at end
  EXPECT_EQ(utf8ToUtf16("\xE2\x82x"), (std::u16string{r, r, u'x'}));         // interrupted
  EXPECT_EQ(utf8ToUtf16("\xFF"), (std::u16string{r}));
}

}  // namespace
}  // namespace kestrova::jni
