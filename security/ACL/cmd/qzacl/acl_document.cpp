// An ACL file as the verbs read it.
#include "acl_document.h"

#include "entry_words.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/compile.h"
#include "trouble.h"
#include "whole_file.h"

#include <cstring>
#include <vector>

namespace qzacl {

namespace {

// Counts line feeds ahead of the parser, which overwrites them.
class feed_counter {
public:
    explicit feed_counter(std::string_view text) { find(text); }

    // The line that the rest of the text begins with. A line of the parser holds one line feed at most.
    std::size_t line_of(std::string_view rest) {
        if (next_ != nullptr && rest.data() > next_) {
            ++line_;
            find(rest);
        }
        return line_;
    }

private:
    void find(std::string_view rest) {
        next_ =
            rest.empty() ? nullptr : static_cast<const char *>(std::memchr(rest.data(), '\n', rest.size()));
    }

    const char *next_ = nullptr;
    std::size_t line_ = 1;
};

// Inserts entries into their trees, after a delay in which the memory for the insertion is prefetched. Messages are
// printed in the order of the lines.
class insertions {
public:
    // A name is printed in a line before the first message.
    insertions(sec_acltree_array &trees, const std::string &name) : trees_(trees), name_(name) {}

    bool is_sound() const { return is_sound_; }
    bool lacks_memory() const { return lacks_memory_; }

    void add(const qz::acle_view &entry) {
        if (count_ == waiting_max)
            insert_oldest();
        fetch(entry);
        waiting_[(first_ + count_++) % waiting_max] = entry;
    }

    // Reports a line without an entry, whose error is recorded.
    void refuse(int code) {
        cu_error_t *error = nullptr;
        cu_get_error_1(&error);
        finish();
        cu_pset_error_1(error);
        cu_rel_error_1(error);
        note(code);
    }

    void finish() {
        while (count_ != 0)
            insert_oldest();
    }

private:
    static constexpr std::size_t waiting_max = 16;

    void insert_oldest() {
        const qz::acle_view entry = waiting_[first_];
        first_ = (first_ + 1) % waiting_max;
        --count_;
        note(trees_.add(entry));
    }

    // Most entries have the key of the newest tree.
    void fetch(const qz::acle_view &entry) const {
        const auto trees = trees_.trees();
        if (!trees.empty() && trees.back()->type() == entry.type &&
            trees.back()->mechanism() == entry.mechanism)
            __builtin_prefetch(trees.back()->first_look(entry), 1);
    }

    void note(int code) {
        if (code == SEC_S_OK)
            return;
        if (is_sound_ && !name_.empty())
            print_message(name_ + ": does not parse");
        print_recorded_error();
        is_sound_ = false;
        lacks_memory_ = lacks_memory_ || code == SEC_S_NO_MEMORY;
    }

    sec_acltree_array &trees_;
    std::string name_;
    qz::acle_view waiting_[waiting_max];
    std::size_t first_ = 0;
    std::size_t count_ = 0;
    bool is_sound_ = true;
    bool lacks_memory_ = false;
};

void open(const std::string &file, qz::acl_text &text) {
    if (file == standard_input)
        return require(text.take(read_whole(file)));
    qz::vetted_file vetted;
    require(read_acl_text(file, vetted, text));
}

bool is_buffer(std::string_view bytes) {
    return !bytes.empty() && static_cast<std::uint8_t>(bytes[0]) == qz::format::buffer_type;
}

std::string_view text_in(qz::byte_span field) {
    const char *text = qz::format::string_in(field);
    return text == nullptr ? std::string_view() : text;
}

} // namespace

acl_document::acl_document(const std::string &file, const permission_set &set, const reading &watched)
    : file_(file), text_(set.get()) {
    try {
        open(file, text_);
        read(watched);
    } catch (const recorded_trouble &) {
        if (watched.names_file)
            print_message(file_ + ": does not read");
        throw;
    }
}

acl_document::acl_document(const std::string &file, std::string_view bytes, const permission_set &set,
                           const reading &watched)
    : file_(file), text_(set.get()) {
    require(text_.take(bytes));
    read(watched);
}

void acl_document::read(const reading &watched) {
    const bool is_compiled = is_buffer(text_.unread());
    trees_.emplace(is_compiled ? std::span<char>() : text_.all());
    if (is_compiled)
        return read_buffer(text_.unread(), watched);
    if (watched.whole_text)
        watched.whole_text(text_.unread());
    read_lines(watched);
}

void acl_document::read_lines(const reading &watched) {
    const std::string_view whole = text_.unread();
    feed_counter feeds(whole);
    insertions inserting(*trees_, watched.names_file ? file_ : std::string());
    qz::parsed_acle record;
    while (!inserting.lacks_memory()) {
        const std::size_t left = text_.unread().size();
        const std::size_t line = feeds.line_of(text_.unread());
        const qz::acl_line found = text_.next(record);
        if (found == qz::acl_line::end)
            break;
        if (found == qz::acl_line::bad)
            inserting.refuse(text_.failure());
        if (found != qz::acl_line::entry)
            continue;
        const qz::acle_view view = qz::view_of(record);
        inserting.add(view);
        if (watched.unnamed && view.identity.empty())
            watched.unnamed(view.type, line);
        if (watched.entry) {
            const qz::entry_fields entry = {view.type, view.perm_mask, kept(view.mechanism), view.identity};
            watched.entry(entry, {line, whole.size() - left, whole.size() - text_.unread().size()});
        }
    }
    inserting.finish();
    if (!inserting.is_sound())
        throw told_trouble();
}

void acl_document::read_buffer(std::string_view bytes, const reading &watched) {
    auto copy = qz::acl::from_bytes(bytes.data(), bytes.size());
    require(copy.code());
    require(copy->to_host());
    compiled_ = std::move(*copy);
    if (watched.entry)
        for_each_stored(compiled_, [&](const qz::entry_fields &entry) { watched.entry(entry, {}); });
}

std::string_view acl_document::kept(std::string_view mechanism) {
    if (mechanism == last_mechanism_)
        return last_mechanism_;
    auto found = mechanisms_.find(mechanism);
    if (found == mechanisms_.end())
        found = mechanisms_.emplace(mechanism).first;
    return last_mechanism_ = *found;
}

std::string acl_document::place(std::size_t line) const {
    std::string text;
    append_place(text, file_, line);
    return text;
}

std::span<sec_acltree_t *const> acl_document::trees() {
    if (is_compiled() && !has_trees_of_buffer_) {
        for_each_stored(compiled_, [&](const qz::entry_fields &entry) {
            const sec_acle_t record = record_of(entry);
            require(sec__add_acle_to_trees(&record, *trees_));
        });
        has_trees_of_buffer_ = true;
    }
    return trees_->trees();
}

qz::acl acl_document::take_acl() {
    if (is_compiled())
        return std::move(compiled_);
    sec_acl_buffer_t buffer = {};
    if (!trees_->trees().empty())
        require(sec__acltrees_to_acl(trees_->trees(), &buffer));
    return qz::acl(buffer);
}

void acl_document::require_compilable() const {
    std::uint64_t size = qz::format::header_size;
    for (const sec_acltree_t *tree : trees_->trees())
        size += qz::format::subacl_header_size + qz::mechanism_max + 1 + tree->packed_size();
    if (trees_->trees().size() <= qz::format::subacls_max && size <= qz::format::buffer_max)
        return;
    // So close to the limits the compiler says whether they are kept, and if not, how.
    sec_acl_buffer_t buffer = {};
    const int result = sec__acltrees_to_acl(trees_->trees(), &buffer);
    const qz::owned<void> owner(buffer.data);
    require(result);
}

void for_each_stored(const qz::acl &acl, const std::function<void(const qz::entry_fields &)> &each) {
    std::vector<qz::byte_span> subacls;
    qz::format::subacl_walk walk(qz::format::bytes_of(*acl.get()));
    while (walk.next() == qz::format::subacl_walk::step::found)
        subacls.push_back(walk.bytes());
    for (auto bytes = subacls.rbegin(); bytes != subacls.rend(); ++bytes) {
        qz::byte_reader reader(*bytes);
        qz::format::subacl head;
        if (!qz::format::read(reader, head))
            continue;
        qz::format::entry entry;
        for (std::uint32_t left = head.entry_count; left != 0 && qz::format::read(reader, entry); --left)
            each({head.type, entry.perm_mask, text_in(head.mechanism), text_in(entry.identity)});
    }
}

void append_place(std::string &text, const std::string &file, std::size_t line) {
    text += file;
    if (line != 0)
        append_number(text.append(":"), line);
}

} // namespace qzacl
