// Creating, displaying and releasing entries and lists of entries.
#include "qzacl_acl/entry.h"

#include "base/owned.h"
#include "qzacl_utils/code_set.h"
#include "report.h"
#include "trace_points.h"

#include <arpa/inet.h>
#include <cstring>

using namespace qz;

namespace {

using text = owned<char>;

// True for mechanisms whose identities end in a host.
bool names_hosts(const char *mechanism) {
    return std::strcmp(mechanism, "unix") == 0 || std::strcmp(mechanism, "hba2") == 0;
}

// Converts one string and its NUL in either direction.
template <class Conversion>
int converted(Conversion conversion, const char *in, text &out) {
    const std::size_t length = std::strlen(in) + 1;
    char *made = nullptr;
    std::size_t made_length = 0;
    const int result = conversion(in, &length, &made, &made_length);
    out.reset(made);
    return result;
}

int set_mechanism(sec_acle_t &acle, const char *mechanism, strings_in code_set) {
    text utf8;
    if (code_set == strings_in::locale) {
        if (const int result = converted(acl__convert_to_utf8, mechanism, utf8); result != SEC_S_OK)
            return result;
    }
    const char *source = code_set == strings_in::locale ? utf8.get() : mechanism;
    const std::size_t length = std::strlen(source);
    // Conversion may have lengthened it.
    if (length > mechanism_max)
        return report_bad_parameter("sec_create_acle", 3, shown_pointer(mechanism));
    std::memcpy(acle.mechanism, source, length + 1);
    return SEC_S_OK;
}

int set_identity(sec_acle_t &acle, const char *identity, strings_in code_set) {
    text made;
    if (code_set == strings_in::locale) {
        if (const int result = converted(acl__convert_to_utf8, identity, made); result != SEC_S_OK)
            return result;
    } else {
        made.reset(strdup(identity));
        if (made == nullptr)
            return report_no_memory("sec__create_acle", std::strlen(identity) + 1);
    }
    acle.identity = made.release();
    return SEC_S_OK;
}

int bad_identity(const char *identity) {
    return report_bad_parameter("sec_create_acle", 4, shown_pointer(identity));
}

// Creates an entry of a mechanism with hosts. An IPv6 address after the '@' is normalized, so that different spellings
// of one address are one identity. Everything else is kept.
int create_with_host(std::uint8_t type, std::uint32_t perm_mask, const char *mechanism, const char *identity,
                     sec_acle_t **acle) {
    const char *at = std::strchr(identity, '@');
    if (at == nullptr && type == SEC_ACLE_USER)
        return bad_identity(identity);
    const char *host = at == nullptr ? identity : at + 1;
    if (*host == '\0')
        return bad_identity(identity);

    in6_addr address = {};
    if (inet_pton(AF_INET6, host, &address) != 1)
        return sec__create_acle(type, perm_mask, mechanism, identity, strings_in::locale, acle);

    char formatted[INET6_ADDRSTRLEN] = {};
    static_cast<void>(cu_ipaddr_ntop_1(&address, formatted));
    const auto prefix = static_cast<std::size_t>(host - identity);
    const std::size_t size = prefix + std::strlen(formatted) + 1;
    const owned<char[]> normalised = allocate<char>(size);
    if (normalised == nullptr)
        return report_no_memory("sec_create_acle", size);
    std::memcpy(normalised.get(), identity, prefix);
    std::memcpy(normalised.get() + prefix, formatted, size - prefix);
    return sec__create_acle(type, perm_mask, mechanism, normalised.get(), strings_in::locale, acle);
}

int create_checked(std::uint8_t type, std::uint32_t perm_mask, const char *mechanism, const char *identity,
                   sec_acle_t **acle) {
    if (acle != nullptr)
        *acle = nullptr;
    if (!is_acle_type(type))
        return report_bad_parameter("sec_create_acle", 1, type);
    if (has_mechanism(type)) {
        const std::size_t length = mechanism == nullptr ? 0 : strnlen(mechanism, mechanism_max + 1);
        if (length == 0 || length > mechanism_max)
            return report_bad_parameter("sec_create_acle", 3, shown_pointer(mechanism));
    }
    if (has_identity(type) && (identity == nullptr || *identity == '\0'))
        return bad_identity(identity);
    if (acle == nullptr)
        return report_bad_parameter("sec_create_acle", 5, 0);
    if (has_mechanism(type) && names_hosts(mechanism))
        return create_with_host(type, perm_mask, mechanism, identity, acle);
    return sec__create_acle(type, perm_mask, mechanism, identity, strings_in::locale, acle);
}

int display_checked(const sec_acle_t *acle, char **mechanism, char **identity) {
    constexpr const char *function = "sec_display_acle_id";
    if (mechanism != nullptr)
        *mechanism = nullptr;
    if (identity != nullptr)
        *identity = nullptr;
    if (acle == nullptr)
        return report_bad_parameter(function, 1, 0);
    if (mechanism == nullptr)
        return report_bad_parameter(function, 2, 0);
    if (identity == nullptr)
        return report_bad_parameter(function, 3, 0);

    if (is_single_type(acle->type))
        return SEC_S_OK;
    if (!has_identity(acle->type))
        return report(SEC_S_BAD_ACLE, msg::acle_type_not_displayable, acle->type);
    const bool has_name = acle->identity != nullptr && acle->identity[0] != '\0';
    if (!has_name || (has_mechanism(acle->type) && acle->mechanism[0] == '\0'))
        return report(SEC_S_BAD_ACLE, msg::acle_incomplete);

    text shown_mechanism;
    if (has_mechanism(acle->type)) {
        const int result = converted(acl__convert_from_utf8, acle->mechanism, shown_mechanism);
        if (result != SEC_S_OK)
            return result;
    }
    text shown_identity;
    if (const int result = converted(acl__convert_from_utf8, acle->identity, shown_identity);
        result != SEC_S_OK)
        return result;
    *mechanism = shown_mechanism.release();
    *identity = shown_identity.release();
    return SEC_S_OK;
}

void release_entries(sec_aclelist_t &list) {
    for (std::int32_t index = 0; index < list.count; ++index)
        sec_release_acle(list.acles[index]);
    std::free(list.acles);
    list = {};
}

} // namespace

int sec__create_acle(std::uint8_t type, std::uint32_t perm_mask, const char *mechanism, const char *identity,
                     strings_in code_set, sec_acle_t **acle) {
    *acle = nullptr;
    // The identity is set last, so that a failure leaves only this block. Releasing it is not traced: no caller saw it.
    owned<sec_acle_t> made(static_cast<sec_acle_t *>(std::calloc(1, sizeof(sec_acle_t))));
    if (made == nullptr)
        return report_no_memory("sec__create_acle", sizeof(sec_acle_t));
    made->perm_mask = perm_mask;
    made->type = type;
    if (has_mechanism(type)) {
        if (const int result = set_mechanism(*made, mechanism, code_set); result != SEC_S_OK)
            return result;
    }
    if (has_identity(type)) {
        if (const int result = set_identity(*made, identity, code_set); result != SEC_S_OK)
            return result;
    }
    *acle = made.release();
    return SEC_S_OK;
}

int sec_create_acle(std::uint8_t type, std::uint32_t perm_mask, const char *mechanism, const char *identity,
                    sec_acle_t **acle) {
    return run(operation::create_acle, std::tie(type, perm_mask, mechanism, identity, acle),
               [&] { return create_checked(type, perm_mask, mechanism, identity, acle); });
}

int sec_display_acle_id(const sec_acle_t *acle, char **mechanism, char **identity) {
    return run(
        operation::display_acle_id, std::tie(acle, mechanism, identity),
        [&] { return display_checked(acle, mechanism, identity); },
        [&] { return std::tie(*mechanism, *identity); });
}

void sec__trace_release(const sec_acle_t *acle) {
    run(operation::release_acle, std::tie(acle), [] { return SEC_S_OK; });
}

void sec__trace_release(const void *place, const acle_view &acle) {
    const traced::acle shown(place, acle.type, acle.perm_mask, acle.mechanism, acle.identity);
    run(operation::release_acle, std::tie(shown), [] { return SEC_S_OK; });
}

void sec_release_acle(sec_acle_t *acle) {
    sec__trace_release(acle);
    if (acle != nullptr) {
        std::free(acle->identity);
        std::free(acle);
    }
}

void sec_release_aclelist(sec_aclelist_t *list) {
    run(operation::release_aclelist, std::tie(list), [&] {
        if (list != nullptr && list->count != 0 && list->acles != nullptr)
            release_entries(*list);
        return SEC_S_OK;
    });
}
