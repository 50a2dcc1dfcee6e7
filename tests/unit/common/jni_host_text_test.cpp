// Host bytes on their way into a Java string: NewStringUTF takes modified
// UTF-8 only, and a USB host sends whatever it likes.
#include <gtest/gtest.h>

#include <string>

#include "common/JniUtil.h"

TEST(JniHostText, WellFormedTextIsKeptAndEveryStrayByteBecomesAQuestionMark) {
    struct Case {
        std::string in, out;
    } cases[] = {
        {"GetData(1,\"a b\")", "GetData(1,\"a b\")"},
        {"", ""},
        {"caf\xC3\xA9 \xE2\x82\xAC", "caf\xC3\xA9 \xE2\x82\xAC"},                 // 2- and 3-byte characters
        {"\xF0\x9F\x98\x80", "\xED\xA0\xBD\xED\xB8\x80"},                         // U+1F600 as a surrogate pair
        {"\xFF\xFE", "??"},                                                       // never a lead byte
        {"\x80x", "?x"},                                                          // continuation without lead
        {"\xC3", "?"},                                                            // cut by the end of the text
        {"\xE2\x82", "??"},                                                       // each stray byte on its own
        {"\xC0\x80", "??"},                                                       // an overlong NUL
        {"\xE0\x80\xAF", "???"},                                                  // an overlong '/'
        {"\xF4\x90\x80\x80", "????"},                                             // above U+10FFFF
        {"\xC3(", "?("},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.in);
        EXPECT_EQ(JNI_HostTextToModifiedUtf8(c.in.c_str()), c.out);
    }
    EXPECT_EQ(JNI_HostTextToModifiedUtf8(nullptr), "");
}
