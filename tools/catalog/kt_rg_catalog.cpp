// SPDX-License-Identifier: MIT
// kt_rg_catalog: writes the source of the message catalog to standard output, for gencat.
//
// The texts come from the list that the library's built-in texts come from, so the two can't differ. Nothing reports
// message 0, and a catalog can't hold it.
#include <cstdio>

#include "frame/rg_i_messages.h"

namespace
{

// As it stands between double quotes in a catalog's source.
void put_quoted(const char * p_text)
{
    std::putchar('"');
    for (; *p_text != '\0'; ++p_text)
        switch (*p_text) {
        case '\n':
            std::fputs("\\n", stdout);
            break;
        case '"':
        case '\\':
            std::putchar('\\');
            [[fallthrough]];
        default:
            std::putchar(*p_text);
            break;
        }
    std::putchar('"');
}

} // namespace

int main()
{
    std::printf("$ Messages of libkt_rg. To translate, keep the numbers; the conversions may change places.\n");
    std::printf("$quote \"\n$set %d\n", RG_I_MESSAGE_SET);
    for (const rg_i_message_t & message : RG_I_MESSAGES)
        if (message.index != 0) {
            std::printf("%d ", message.index);
            put_quoted(message.p_text);
            std::putchar('\n');
        }
    return std::fflush(stdout) == 0 && std::ferror(stdout) == 0 ? 0 : 1;
}
