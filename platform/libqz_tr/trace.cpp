// The public operations. They check arguments and leave the calling thread undisturbed.
#include "qz/tr.h"

#include "base/kept_errno.h"
#include "base/owned.h"
#include "base/uncancelled.h"
#include "libqz_tr/line.h"
#include "libqz_tr/registry.h"
#include "libqz_tr/trace_file.h"

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstring>
#include <unistd.h>

namespace {

using qz::tr::trace_line;
namespace registry = qz::tr::registry;
namespace trace_file = qz::tr::trace_file;

// Trace calls sit in the middle of other operations. They must preserve errno and must not be cancellation points.
struct undisturbed_caller {
    const qz::kept_errno error_number{};
    const qz::uncancelled cancellation{};
};

// What a line says besides its items, kept so that a second try gives the same line.
struct record_head {
    timespec time{};
    pid_t pid = getpid();
    pid_t tid = gettid();
    const char *component;
    int id;
};

void format_record(trace_line &line, const record_head &head, int count, va_list items) {
    line.start(head.time, head.pid, head.tid, head.component, head.id);
    for (; count > 0 && !line.too_long(); --count) {
        const void *address = va_arg(items, const void *);
        const std::size_t length = va_arg(items, std::size_t);
        line.item(address, length);
    }
    line.end();
}

// Most lines fit on the stack. Only a larger one is allocated, once its size is known.
int record(const record_head &head, int count, va_list items, va_list items_again) {
    std::array<char, 4096> small;
    trace_line line{small};
    format_record(line, head, count, items);
    if (line.too_long())
        return TR_TOO_LARGE;
    if (line.fits())
        return trace_file::append_line(line.text());
    const auto memory = qz::allocate<char>(line.size());
    if (memory == nullptr)
        return TR_NO_MEMORY;
    trace_line large{{memory.get(), line.size()}};
    format_record(large, head, count, items_again);
    return large.fits() && !large.too_long() ? trace_file::append_line(large.text()) : TR_BAD_PARAMETER;
}

} // namespace

int tr_register_component_1(const char *component, uint8_t *levels, const tr_category_t *categories,
                            int count) {
    if (component == nullptr || count < 0 || (count > 0 && (levels == nullptr || categories == nullptr)))
        return TR_BAD_PARAMETER;
    const undisturbed_caller undisturbed;
    const auto size = static_cast<std::size_t>(count);
    return registry::add(component, {levels, size}, {categories, size});
}

int tr_unregister_component_1(const char *component) {
    if (component == nullptr)
        return TR_BAD_PARAMETER;
    const undisturbed_caller undisturbed;
    return registry::remove(component);
}

int tr_record_id_1(const char *component, int id) { return tr_record_data_1(component, id, 0); }

int tr_record_data_1(const char *component, int id, int count, ...) {
    if (component == nullptr || count < 0)
        return TR_BAD_PARAMETER;
    const undisturbed_caller undisturbed;
    if (!registry::contains(component))
        return TR_NOT_REGISTERED;
    record_head head{.component = component, .id = id};
    clock_gettime(CLOCK_REALTIME, &head.time);
    va_list items;
    va_list items_again;
    va_start(items, count);
    va_copy(items_again, items);
    const int result = record(head, count, items, items_again);
    va_end(items_again);
    va_end(items);
    return result;
}

int tr_get_size_1(uint32_t *size) {
    if (size == nullptr)
        return TR_BAD_PARAMETER;
    const undisturbed_caller undisturbed;
    const std::int64_t bytes = trace_file::size();
    *size = static_cast<uint32_t>(std::clamp<std::int64_t>(bytes, 0, UINT32_MAX));
    return bytes >= 0 ? TR_OK : TR_NO_FILE;
}

int tr_get_filename_1(char *name) {
    if (name == nullptr)
        return TR_BAD_PARAMETER;
    const undisturbed_caller undisturbed;
    const char *file = trace_file::name();
    if (file == nullptr)
        return TR_NO_FILE;
    const std::size_t size = std::strlen(file) + 1;
    if (size > TR_FILENAME_SIZE)
        return TR_TOO_LARGE;
    std::memcpy(name, file, size);
    return TR_OK;
}
