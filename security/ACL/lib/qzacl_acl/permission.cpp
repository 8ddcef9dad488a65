// Permission templates: the default set, and the translation between letters and masks.
#include "qzacl_acl/permission.h"

#include "report.h"
#include "trace_points.h"

#include <bit>

using namespace qz;

extern "C" constinit const sec_perm_template_t acl__default_perm_list[13] = {
    {0x1, 'r', "read", "general purpose read operation"},
    {0x2, 'w', "write", "general purpose write operation"},
    {0x4, 'c', "control", "general purpose control operation"},
    {0x8, 'x', "execute", "general purpose execute operation"},
    {0x10, 'C', "cancel", "general purpose cancel operation"},
    {0x20, 'q', "query", "KDZ query resource"},
    {0x40, 'l', "list", "KDZ enumerate resource"},
    {0x80, 'e', "event", "KDZ event registration/unregistration/quering"},
    {0x100, 'd', "define", "KDZ define/undefine resource"},
    {0x200, 'v', "validate", "KDZ validate resource handle"},
    {0x400, 's', "set", "KDZ set attribute"},
    {0x800, 'a', "set", "KDZ administrative control"},
    {0x1000, 'o', "set", "KDZ online/offline/reset resource"},
};

extern "C" constinit const sec_perm_set_t acl__default_perm_set = {13, acl__default_perm_list};

int sec__translate_perms(const char *text, const sec_perm_set_t *set, std::uint32_t *mask) {
    const auto templates = templates_of(*set);
    for (; *text != '\0'; ++text) {
        const sec_perm_template_t *match = nullptr;
        for (const sec_perm_template_t &candidate : templates) {
            if (candidate.letter == *text) {
                match = &candidate;
                break;
            }
        }
        if (match == nullptr)
            return report(SEC_S_BAD_PERMISSION, msg::no_template_for_letter, *text);
        *mask |= match->bit;
    }
    return SEC_S_OK;
}

int sec__translate_bitmask(std::uint32_t mask, const sec_perm_set_t *set, char *out) {
    const auto templates = templates_of(*set);
    for (; mask != 0; mask &= mask - 1) {
        const std::uint32_t bit = std::uint32_t{1} << std::countr_zero(mask);
        const sec_perm_template_t *match = nullptr;
        for (const sec_perm_template_t &candidate : templates) {
            if (candidate.bit == bit) {
                match = &candidate;
                break;
            }
        }
        if (match == nullptr)
            return report(SEC_S_BAD_PERMISSION, msg::no_template_for_bit, static_cast<int>(bit));
        *out++ = match->letter;
    }
    *out = '\0';
    return SEC_S_OK;
}

int sec_translate_perms(const char *text, const sec_perm_set_t *set, std::uint32_t *mask) {
    return run(
        operation::translate_perms, std::tie(text, set, mask),
        [&] {
            if (mask == nullptr)
                return report_bad_parameter("sec_translate_perms", 3, 0);
            *mask = 0;
            if (text == nullptr)
                return SEC_S_OK;
            return sec__translate_perms(text, set == nullptr ? &acl__default_perm_set : set, mask);
        },
        [&] { return std::tie(*mask); });
}

int sec_translate_bitmask(std::uint32_t mask, const sec_perm_set_t *set, char *out) {
    // Cleared first, because the record of the entry point shows the output.
    if (out != nullptr)
        out[0] = '\0';
    return run(
        operation::translate_bitmask, std::tie(mask, set, out),
        [&] {
            // This name differs from the operation's, but callers match on it.
            if (out == nullptr)
                return report_bad_parameter("sec_translate_mask", 3, 0);
            if (mask == 0)
                return SEC_S_OK;
            return sec__translate_bitmask(mask, set == nullptr ? &acl__default_perm_set : set, out);
        },
        [&] { return std::tie(out); });
}
