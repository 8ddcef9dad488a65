// Access decisions: the permissions that a compiled ACL grants to one party, or to a requester's groups.
//
//   permissions of one party:
//       the sub-ACL is the first one of the type and, for user and expanded entries, of the mechanism
//       no sub-ACL:                          nothing matches
//       unauthenticated or any other:        its one entry matches
//       expanded, and no handler known:      nothing matches
//       for each entry, in the order stored:
//           order = handler(wanted, entry)   for expanded entries, and for users if requested and known
//                 = wanted <=> entry         otherwise, without regard to case
//           order is equal:                  the entry matches
//           order is less, not expanded:     nothing matches; all later entries sort after it, too
//       nothing matches
//
//   permissions of groups:
//       each group as one party, without a handler; the masks of all matches are combined
//
// An entry that does not fit into the buffer, or an identity without a NUL where the comparison gets to it, is an
// error. The stored order is not checked: if it is not ascending, it hides entries.
//
// The buffer is read in place. Only recording a long identity allocates memory, and the one lock is held only while
// looking up a handler.
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/id_handlers.h"
#include "qzacl_acl/packed_identity.h"
#include "report.h"
#include "trace_points.h"

#include <algorithm>
#include <array>
#include <cstring>

using namespace qz;

namespace {

constexpr unsigned type_bits = 0x1f;

int refuse_buffer(byte_span bytes) {
    if (bytes.size() < format::order_offset || bytes[0] != format::buffer_type ||
        bytes[1] != format::buffer_version)
        return report(SEC_S_BAD_ACL, msg::not_an_acl_buffer);
    if (bytes.size() > format::order_offset && bytes[format::order_offset] != format::host_order)
        return report(SEC_S_BAD_ACL, msg::wrong_byte_order);
    return report_corrupt(__LINE__);
}

inline int check_buffer(byte_span bytes) {
    const bool is_ours = bytes.size() >= format::header_size &&
                         std::memcmp(bytes.data(), format::empty_acl, format::count_offset) == 0;
    return is_ours ? SEC_S_OK : refuse_buffer(bytes);
}

struct single_request {
    std::uint8_t type_argument;
    const char *mechanism;
    const char *identity;
    std::int32_t walked = -1; // number of entries in the user sub-ACL that was searched

    std::uint8_t type() const { return type_argument & type_bits; }
    bool uses_handler() const { return (type_argument & SEC_ACLE_USE_ID_HANDLER) != 0; }
};

int no_match(const single_request &request, const char *identity) {
    return report(SEC_S_BAD_ACLE, msg::no_matching_acle, request.type_argument,
                  request.mechanism == nullptr ? "" : request.mechanism, identity);
}

int evaluate_single_entry(const single_request &request, const format::subacl &head, byte_reader entries,
                          std::uint32_t &mask) {
    if (head.entry_count > 1)
        return report(SEC_S_BAD_ACL, msg::more_than_one_acle, acl_source, __LINE__);
    if (head.entry_count == 0)
        return no_match(request, "");
    format::entry entry;
    if (!format::read(entries, entry))
        return report_corrupt(__LINE__);
    mask = entry.perm_mask;
    return SEC_S_OK;
}

// A failed look-up does not fail the decision, which uses what was found.
sec_id_compare_fn find_handler(std::uint32_t kind, const char *mechanism) {
    sec_id_compare_fn handler = nullptr;
    if (sec__get_id_handler(kind, mechanism, &handler) != SEC_S_OK)
        cu_set_no_error_1();
    return handler;
}

// Calls a handler for each entry. An error that it records for an entry that does not match is cleared.
int evaluate_by_handler(const single_request &request, sec_id_compare_fn handler, const format::subacl &head,
                        byte_reader entries, std::uint32_t &mask) {
    const bool is_sorted = request.type() == SEC_ACLE_USER;
    for (std::uint32_t left = head.entry_count; left != 0; --left) {
        format::entry entry;
        if (!format::read(entries, entry))
            return report_corrupt(__LINE__);
        const char *identity = format::string_in(entry.identity);
        if (identity == nullptr)
            return report_corrupt(__LINE__);
        const int order = handler(request.identity, identity);
        if (order == 0) {
            mask = entry.perm_mask;
            return SEC_S_OK;
        }
        cu_set_no_error_1();
        if (is_sorted && order < 0)
            break;
    }
    return no_match(request, request.identity);
}

// Skips entries that sort before the wanted identity, with the closer comparison.
[[gnu::noinline]] format::skipped_entries skip_before(identity_start wanted, byte_reader entries,
                                                      std::uint32_t left) {
    return format::skip_entries_while(
        entries, left, identity_block::size, [&](std::uint8_t, byte_span identity) {
            return wanted.is_clearly_after(identity_block(identity)) && format::ends_in_nul(identity);
        });
}

// Compares the wanted identity with the entries from the next one on, and leaves the walk before the entry that
// decides. Without one, the wanted identity sorts after all of them. Inline, so that the walk stays in registers of the
// caller.
[[gnu::always_inline]] inline identity_order compare_next(const wanted_identity &wanted,
                                                          format::entry_walk &walk, format::entry &entry) {
    const identity_start start = wanted.start();
    walk.step(format::skip_entries_while(
        walk.entries, walk.left, identity_block::size,
        [&](std::uint8_t, byte_span identity) { return start.is_far_after(identity); }));
    while (walk.left != 0) {
        byte_reader next = walk.entries;
        if (!format::read(next, entry))
            return identity_order::unknown;
        const identity_order order = wanted.compare(entry.identity);
        if (order != identity_order::after)
            return order;
        walk = {next, walk.left - 1};
        walk.step(skip_before(start, walk.entries, walk.left));
    }
    return identity_order::after;
}

int evaluate_user(const single_request &request, const format::subacl &head, byte_reader entries,
                  std::uint32_t &mask) {
    format::entry_walk walk{entries, head.entry_count};
    format::entry entry;
    switch (compare_next(wanted_identity(request.identity), walk, entry)) {
    case identity_order::same:
        mask = entry.perm_mask;
        return SEC_S_OK;
    case identity_order::unknown:
        return report_corrupt(__LINE__);
    default:
        return no_match(request, request.identity);
    }
}

int evaluate_single(const sec_acl_buffer_t *acl, single_request &request, const char *subacl_mechanism,
                    std::uint32_t *mask) {
    constexpr const char *function = "sec__single_acle_perm";
    if (acl == nullptr)
        return report_bad_parameter(function, 1, 0);
    if (mask == nullptr)
        return report_bad_parameter(function, 5, 0);
    const byte_span bytes = format::bytes_of(*acl);
    if (const int result = check_buffer(bytes); result != SEC_S_OK)
        return result;
    const std::uint8_t type = request.type();
    if (!is_single_type(type) && !has_mechanism(type))
        return report(SEC_S_BAD_PARAMETER, msg::type_not_evaluated, request.type_argument);
    if (has_mechanism(type)) {
        if (request.mechanism == nullptr || *request.mechanism == '\0')
            return report(SEC_S_BAD_PARAMETER, msg::mechanism_required);
        if (request.identity == nullptr || *request.identity == '\0')
            return report(SEC_S_BAD_PARAMETER, msg::identity_required);
    }
    *mask = 0;

    format::subacl_walk walk(bytes);
    if (!sec__find_subacl(walk, type, subacl_mechanism == nullptr ? request.mechanism : subacl_mechanism))
        return no_match(request, "");
    const format::subacl &head = walk.current();
    const byte_reader entries = walk.entries();
    if (is_single_type(type))
        return evaluate_single_entry(request, head, entries, *mask);

    sec_id_compare_fn handler = nullptr;
    if (type == SEC_ACLE_EXPANDED) {
        handler = find_handler(SEC_ID_HANDLER_EXPANDED, request.mechanism);
        if (handler == nullptr)
            return no_match(request, request.identity);
        return evaluate_by_handler(request, handler, head, entries, *mask);
    }
    request.walked = static_cast<std::int32_t>(head.entry_count);
    if (request.uses_handler())
        handler = find_handler(SEC_ID_HANDLER_USER, request.mechanism);
    return handler == nullptr ? evaluate_user(request, head, entries, *mask)
                              : evaluate_by_handler(request, handler, head, entries, *mask);
}

// Evaluates some of the requester's groups with one pass over the entries.
//
// The first entry that does not sort before a group decides about it. So the groups are evaluated in ascending
// order: all entries before one group's deciding entry sort before every later group, too.
class group_batch {
public:
    static constexpr std::size_t capacity = 64;

    void add(const char *name) { names_[count_++] = name; }
    bool is_full() const { return count_ == capacity; }

    int evaluate(const format::subacl &head, byte_reader entries, std::uint32_t &mask, bool &is_found) {
        std::sort(names_.begin(), names_.begin() + count_,
                  [](const char *a, const char *b) { return cu_strcasecmp_posix_1(a, b) < 0; });
        format::entry_walk walk{entries, head.entry_count};
        for (std::size_t index = 0; index < count_ && walk.left != 0; ++index) {
            format::entry entry;
            const auto order = compare_next(wanted_identity(names_[index]), walk, entry);
            if (order == identity_order::unknown)
                return report_corrupt(__LINE__);
            if (order == identity_order::same) {
                mask |= entry.perm_mask;
                is_found = true;
            }
        }
        count_ = 0;
        return SEC_S_OK;
    }

private:
    std::array<const char *, capacity> names_;
    std::size_t count_ = 0;
};

int no_group() { return report(SEC_S_BAD_ACLE, msg::no_matching_acle, SEC_ACLE_GROUP, "", ""); }

int evaluate_groups(const sec_acl_buffer_t *acl, std::int32_t count, const sec_group_ref_t *groups,
                    std::uint32_t *mask) {
    constexpr const char *function = "sec__group_acles_perm";
    if (acl == nullptr)
        return report_bad_parameter(function, 1, 0);
    if (count != 0 && groups == nullptr)
        return report_bad_parameter(function, 3, 0);
    if (mask == nullptr)
        return report_bad_parameter(function, 4, 0);
    const byte_span bytes = format::bytes_of(*acl);
    if (const int result = check_buffer(bytes); result != SEC_S_OK)
        return result;
    *mask = 0;
    if (count == 0)
        return SEC_S_OK;
    format::subacl_walk walk(bytes);
    if (!sec__find_subacl(walk, SEC_ACLE_GROUP, nullptr) || count < 0)
        return no_group();

    std::uint32_t granted = 0;
    bool is_found = false;
    group_batch batch;
    for (std::int32_t index = 0; index < count; ++index) {
        if (groups[index].name != nullptr)
            batch.add(groups[index].name);
        if (batch.is_full() || index == count - 1) {
            if (const int result = batch.evaluate(walk.current(), walk.entries(), granted, is_found);
                result != SEC_S_OK)
                return result;
        }
    }
    if (!is_found)
        return no_group();
    *mask = granted;
    return SEC_S_OK;
}

} // namespace

int sec__single_acle_perm(const sec_acl_buffer_t *acl, std::uint8_t type, const char *mechanism,
                          const char *subacl_mechanism, const char *identity, std::uint32_t *mask) {
    return run(
        operation::single_acle_perm, std::tie(acl, type, mechanism, identity, mask),
        [&] {
            const trace_timer<point::deciding> timer;
            single_request request{type, mechanism, identity};
            const int result = evaluate_single(acl, request, subacl_mechanism, mask);
            timer.stop(request.walked, type, mechanism, identity);
            return result;
        },
        [&] { return std::tie(*mask); });
}

int sec__group_acles_perm(const sec_acl_buffer_t *acl, std::int32_t count, const sec_group_ref_t *groups,
                          std::uint32_t *mask) {
    return run(
        operation::group_acles_perm, std::tie(acl, count, groups, mask),
        [&] {
            const trace_timer<point::deciding_for_groups> timer;
            const int result = evaluate_groups(acl, count, groups, mask);
            timer.stop();
            return result;
        },
        [&] { return std::tie(*mask); });
}
