// Reports about entries that trees and packed sub-ACLs share: duplicates and missing entries.
#include "qzacl_acl/acle_report.h"

#include "report.h"
#include "trace_points.h"

using namespace qz;

int sec__report_duplicate(const acle_view &acle) {
    const int letter = type_letter(acle.type);
    if (is_single_type(acle.type))
        return report(SEC_S_BAD_ACLE, msg::duplicate_single_acle, letter);
    if (acle.type == SEC_ACLE_GROUP)
        return report(SEC_S_BAD_ACLE, msg::duplicate_group, letter, acle.identity.data());
    return report(SEC_S_BAD_ACLE, msg::duplicate_acle, letter, acle.mechanism.data(), acle.identity.data());
}

void sec__trace_replacement(const acle_view &acle) {
    if (!traces(point::entry_replaced))
        return;
    const char *type = "group";
    switch (acle.type) {
    case SEC_ACLE_UNAUTHENTICATED:
        type = "unauthenticated";
        break;
    case SEC_ACLE_ANYOTHER:
        type = "anyother";
        break;
    case SEC_ACLE_USER:
        type = "user";
        break;
    case SEC_ACLE_EXPANDED:
        type = "user-expanded";
        break;
    default:
        break;
    }
    constexpr std::string_view none = "<none>";
    point::entry_replaced.record(type, is_single_type(acle.type) ? none : acle.mechanism,
                                 acle.type == SEC_ACLE_USER ? acle.identity : none);
}

int sec__acle_not_found(int code, const acle_view &acle) {
    return report(code, msg::acle_not_found, acle.type, has_mechanism(acle.type) ? acle.mechanism.data() : "",
                  has_identity(acle.type) ? acle.identity.data() : "");
}
