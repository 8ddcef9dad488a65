// The trace points of the library, each declared once with its number, levels and items. Recording one with other items
// does not compile. docs/tracing.md explains them to readers of a trace.
#ifndef QZACL_TRACE_POINTS_H
#define QZACL_TRACE_POINTS_H

#include "qzacl_trace.h"

namespace qz::point {

using traced::signed_number;
using traced::text;
using traced::unsigned_number;

inline constexpr traced_at errors = {trace_category::errors};
inline constexpr traced_at info = {trace_category::info};
inline constexpr traced_at info_at_1 = {trace_category::info, 1, 1};
inline constexpr traced_at info_above_7 = {trace_category::info, 8};
inline constexpr traced_at perf = {trace_category::perf};
inline constexpr traced_at perf_at_1 = {trace_category::perf, 1, 1};
inline constexpr traced_at perf_at_2 = {trace_category::perf, 2, 2};

// Registration, which does its own level test. Item: the level of timings.
inline constexpr trace_point<0, perf, unsigned_number> registered;

// Timings. Texts are file names unless noted.
inline constexpr timed_point<1, perf_at_1, text> choosing_file;
inline constexpr timed_point<2, perf_at_1, text> reading_file;
inline constexpr timed_point<3, perf_at_1, text, unsigned_number> parsing; // line counter
inline constexpr timed_point<4, perf_at_2, text> opening_file;
inline constexpr timed_point<6, perf_at_2> reading_descriptor;
inline constexpr timed_point<7, perf_at_2, signed_number, unsigned_number, text, text>
    deciding; // users searched, type, mechanism, identity
inline constexpr timed_point<8, perf_at_2> deciding_for_groups;

// Byte order.
inline constexpr trace_point<104, info> in_host_order;
inline constexpr trace_point<106, info> converting_to_host_order;

// Writing a cache.
inline constexpr trace_point<107, info_at_1, text> nothing_to_cache;
inline constexpr trace_point<108, errors, text, signed_number> name_too_long_for_cache; // its length
inline constexpr trace_point<109, errors, text, text, signed_number> query_failed;      // call, errno
inline constexpr trace_point<110, info, text> cache_is_new;
inline constexpr trace_point<111, errors, text, unsigned_number, unsigned_number, unsigned_number,
                             unsigned_number>
    cache_owner_differs; // user and group of the cache, and of the text
inline constexpr trace_point<111, errors, text, unsigned_number, unsigned_number>
    cache_mode_differs; // mode of the cache, and of the text

// Parsing.
inline constexpr trace_point<113, info, text, text, text> entry_replaced; // type, mechanism, identity
inline constexpr trace_point<114, info_above_7, unsigned_number, unsigned_number, text, text, unsigned_number>
    line_read; // line, type, mechanism, identity, permission mask
inline constexpr trace_point<115, errors, unsigned_number, traced::size> line_too_long; // line, length

// Reading: which file, and why.
inline constexpr trace_point<116, info, text> file_is_empty;
inline constexpr trace_point<117, info, text> examining_cache;
inline constexpr trace_point<118, info, text, signed_number> cache_not_examined; // errno
inline constexpr trace_point<119, info, text> cache_not_current;
inline constexpr trace_point<120, info, text, unsigned_number, unsigned_number, unsigned_number,
                             unsigned_number, unsigned_number, unsigned_number>
    cache_unlike_text; // user and group of the text, and of the cache; mode of the text, and of the cache
inline constexpr trace_point<121, info, text> opening;
inline constexpr trace_point<122, info, text, signed_number> cannot_open;                       // errno
inline constexpr trace_point<123, info, text, signed_number> file_not_examined;                 // errno
inline constexpr trace_point<125, info, text, traced::size> no_memory_for_file;                 // its size
inline constexpr trace_point<127, info, text, traced::size, traced::signed_size> read_is_short; // size, read

} // namespace qz::point

namespace qz::operation {

using traced::acl;
using traced::acle;
using traced::address;
using traced::signed_number;
using traced::text;
using traced::text_or_nil;
using traced::unsigned_number;

inline constexpr auto cleared = error_at_entry::cleared;
inline constexpr auto kept = error_at_entry::kept;

inline constexpr traced_operation<9, cleared, with_arguments<text, text, address, unsigned_number, address>,
                                  leaves_outputs<unsigned_number>>
    read_acl_file;
inline constexpr traced_operation<15, cleared, with_arguments<signed_number, address, address>, leaves_result>
    read_acl_from_data;
inline constexpr traced_operation<20, cleared, with_acl_and<address>, leaves_outputs<signed_number>> list_acl;
inline constexpr traced_operation<28, cleared, with_acl_and<unsigned_number, text, address>,
                                  leaves_outputs<signed_number>>
    list_acl_by_type;
inline constexpr traced_operation<36, kept, with_arguments<traced::aclelist>, leaves_bare> release_aclelist;
inline constexpr traced_operation<
    40, cleared, with_arguments<unsigned_number, unsigned_number, text, text, address>, leaves_result>
    create_acle;
inline constexpr traced_operation<45, kept, with_arguments<acle>, leaves_bare> release_acle;
inline constexpr traced_operation<49, cleared, with_arguments<acle, address, address>,
                                  leaves_outputs<text, text>>
    display_acle_id;
inline constexpr traced_operation<55, cleared, with_arguments<signed_number, acl>, leaves_result>
    convert_acl_to_host;
inline constexpr traced_operation<60, cleared, with_arguments<acle, acl>, leaves_result> add_acle_to_acl;
inline constexpr traced_operation<65, cleared, with_arguments<acle, acl>, leaves_result> del_acle_from_acl;
inline constexpr traced_operation<70, cleared, with_arguments<acl>, leaves_bare> release_acl;
inline constexpr traced_operation<74, cleared, with_arguments<unsigned_number, text, address>, leaves_result>
    register_id_handler;
inline constexpr traced_operation<79, cleared, with_arguments<acl, unsigned_number, text, text, address>,
                                  leaves_outputs<unsigned_number>>
    single_acle_perm;
inline constexpr traced_operation<85, cleared, with_arguments<acl, signed_number, address, address>,
                                  leaves_outputs<unsigned_number>>
    group_acles_perm;
inline constexpr traced_operation<91, kept, with_arguments<text_or_nil, address, address>,
                                  leaves_outputs<unsigned_number>>
    translate_perms;
inline constexpr traced_operation<97, kept, with_arguments<unsigned_number, address, text_or_nil>,
                                  leaves_outputs<text>>
    translate_bitmask;

} // namespace qz::operation

#endif
