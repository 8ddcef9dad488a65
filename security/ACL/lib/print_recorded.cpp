// Printing the recorded error.
#include "print_recorded.h"

#include "report.h"

namespace qz {

bool print_recorded(std::FILE *stream, const char *ending) {
    cu_error_t *error = nullptr;
    char *text = nullptr;
    const bool has_text = cu_get_error_1(&error) == SEC_S_OK && cu_get_errmsg_1(error, &text) == SEC_S_OK;
    if (has_text) {
        std::fputs(text, stream);
        if (*ending != '\0')
            std::fputs(ending, stream);
    }
    cu_rel_error_1(error);
    cu_rel_errmsg_1(text);
    return has_text;
}

} // namespace qz
