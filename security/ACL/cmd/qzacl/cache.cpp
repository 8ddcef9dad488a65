// cache: what services read, and whether it is right.
#include "cli.h"
#include "entry_words.h"
#include "qz/service.hpp"
#include "qzacl_acl/cache_vetting.h"
#include "trouble.h"
#include "whole_file.h"

#include <algorithm>
#include <optional>

using namespace qz;

namespace qzacl {

namespace {

struct finding {
    const char *reason = nullptr;  // why the text is read; null: the cache is
    bool is_empty = false;         // which is right without a cache
    std::optional<bool> same = {}; // whether a cache that is read says what the text says

    status exit_status() const {
        if (reason != nullptr)
            return is_empty ? yes : no;
        return same ? (*same ? yes : no) : failed;
    }
};

// Why services read the text: the rules of cache_vetting in the order in which they are reported.
const char *reason_of(const std::string &file, const struct stat &text) {
    const std::string name = file + cache_extension;
    struct stat cache = {};
    if (stat(name.c_str(), &cache) != 0)
        return "missing";
    if (cache.st_mtime < text.st_mtime)
        return "not later";
    if (cache.st_mtime == text.st_mtime)
        return "same second";
    if (cache.st_uid != text.st_uid || cache.st_gid != text.st_gid)
        return "owner";
    posix_acl of_text;
    posix_acl of_cache;
    if (((cache.st_mode ^ text.st_mode) & permission_bits) != 0 || !of_text.read(file.c_str()) ||
        !of_cache.read(name.c_str()) || !(of_text == of_cache))
        return "mode";
    return "damaged";
}

finding examine(const std::string &file, const permission_set &set) {
    if (file == standard_input)
        throw wrong_use("standard input has no cache");
    struct stat text = {};
    if (stat(file.c_str(), &text) == 0 && S_ISREG(text.st_mode) && text.st_size == 0)
        return {"empty", true};
    // Reads the file as services do. The library reports a missing file.
    std::uint32_t flags = 0;
    const auto read = acl::read_file(file.c_str(), nullptr, set.get(), SEC_READ_ACL_CONVERT, &flags);
    require(read.code());
    if ((flags & SEC_READ_ACL_TEXT) != 0) {
        if (read->bytes().empty()) // nothing is compiled from a text without entries
            return {"empty", true};
        return {reason_of(file, text)};
    }
    finding made;
    const auto compiled = acl::read_file(file.c_str(), nullptr, set.get(), SEC_READ_ACL_TEXT);
    if (!compiled) {
        print_message(file + ": does not parse");
        print_recorded_error();
        return made;
    }
    const auto is_same = same(*read, *compiled);
    require(is_same.code());
    made.same = *is_same;
    return made;
}

void tell(const std::string &file, const finding &found, output &out) {
    if (out.is_json()) {
        json object;
        object["file"] = json_text(file);
        object["reads"] = found.reason == nullptr ? "cache" : "text";
        object["reason"] = found.reason == nullptr ? json() : json(found.reason);
        object["same"] = found.same ? json(*found.same) : json();
        return out.object(object);
    }
    std::string line = file + ": ";
    if (found.reason != nullptr)
        line.append("text (").append(found.reason).append(")");
    else if (!found.same)
        line += "cache, but the text does not parse";
    else
        line += *found.same ? "cache, says the same" : "cache, says something else";
    out.line(line);
}

} // namespace

int cache(const call &call) {
    int status = yes;
    for (const std::string &file : call.line.words) {
        try {
            const finding found = examine(file, call.permissions);
            tell(file, found, call.out);
            status = std::max<int>(status, found.exit_status());
        } catch (const recorded_trouble &) {
            print_message(file + ": does not read");
            print_recorded_error();
            status = failed;
        }
    }
    return status;
}

} // namespace qzacl
