// The message table. It is made at compile time, so no code runs to fill it.
#include "msg/qzseclib_msg.h"

using namespace qz;

namespace {

constexpr std::array<const char *, msg::table_size> make_table() {
    std::array<const char *, msg::table_size> table{};
    table[0] = "Reserved: DO NOT USE!";
    for (const msg::text_entry &entry : msg::texts)
        table[static_cast<std::size_t>(entry.id)] = entry.text;
    return table;
}

} // namespace

constinit const std::array<const char *, msg::table_size> cu_mesgtbl_qzseclib_msg = make_table();

constinit const char cu_badid_qzseclib_msg[] = "Bad message id for message set qzseclib_msg";
