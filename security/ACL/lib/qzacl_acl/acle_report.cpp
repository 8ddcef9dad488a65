// What trees and packed sub-ACLs tell alike of an entry that they hold already, or do not hold.
#include "qzacl_acl/acle_report.h"

#include "qzacl_trace.h"
#include "report.h"

int sec__report_duplicate(const qz::acle_view &acle) {
    const int letter = qz::type_letter(acle.type);
    if (qz::is_single_type(acle.type))
        return qz::report(SEC_S_BAD_ACLE, qz::msg::duplicate_single_acle, letter);
    if (acle.type == SEC_ACLE_GROUP)
        return qz::report(SEC_S_BAD_ACLE, qz::msg::duplicate_group, letter, acle.identity.data());
    return qz::report(SEC_S_BAD_ACLE, qz::msg::duplicate_acle, letter, acle.mechanism.data(),
                      acle.identity.data());
}

void sec__trace_replacement(const qz::acle_view &acle) {
    if (!qz::traces(qz::trace_category::info))
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
    qz::trace_data(113, qz::item(type), qz::item(qz::is_single_type(acle.type) ? "<none>" : acle.mechanism),
                   qz::item(acle.type == SEC_ACLE_USER ? acle.identity : "<none>"));
}

int sec__acle_not_found(int code, const qz::acle_view &acle) {
    return qz::report(code, qz::msg::acle_not_found, acle.type,
                      qz::has_mechanism(acle.type) ? acle.mechanism.data() : "",
                      qz::has_identity(acle.type) ? acle.identity.data() : "");
}
