// Writes the default texts as a message source for gencat: what translators start from.
#include "msg/qzseclib_msg.h"

#include <cstdio>

namespace {

void write_quoted(std::string_view text) {
    std::fputc('"', stdout);
    for (const char c : text) {
        switch (c) {
        case '\n':
            // A text line ends its source line too, which a backslash continues.
            std::fputs("\\n\\\n", stdout);
            break;
        case '\t':
            std::fputs("\\t", stdout);
            break;
        case '"':
        case '\\':
            std::fputc('\\', stdout);
            [[fallthrough]];
        default:
            std::fputc(c, stdout);
            break;
        }
    }
    std::fputs("\"\n", stdout);
}

} // namespace

int main() {
    std::printf("$ Messages of the ACL library and its checker. The conversions (%%1$s and the like) of a "
                "text must stay;\n"
                "$ their order may change. A text whose conversions differ is not used.\n"
                "$set %d\n$quote \"\n",
                qz::msg::catalog_set);
    for (const qz::msg::text_entry &entry : qz::msg::texts) {
        std::printf("%d ", entry.id);
        write_quoted(entry.text);
    }
    return std::fflush(stdout) == 0 ? 0 : 1;
}
