// The ACL dump: an ACL buffer in readable form, into a sink of lines and
// failures. Every line is a catalogue message, formatted through the
// thread's error record so that the wording follows the catalogue's
// translations; the record is cleared after each line.
#include "dump.h"

#include <cstdio>
#include <cstring>
#include <memory>

#include <kx_cu.h>

#include "alloc.h"
#include "convert.h"
#include "entries.h"
#include "report.h"

namespace kxacl {

namespace {

// Error id of the records that carry the dump's own lines.
inline constexpr kx_int32_t dump_line = 1;

// Longest permission string: one character per bit, and its NUL.
inline constexpr std::size_t max_perm_text = 33;

enum class channel : bool { lines, failures };
enum class trailing_newline : bool { no = false, yes = true };

// Appends the thread's record as text to a channel of sink, then releases
// and clears it.
void put_record(dump_sink &sink, channel to, trailing_newline newline) {
    cu_error_t *err = nullptr;
    char *text = nullptr;
    cu_get_error_1(&err);
    cu_get_errmsg_1(err, &text);
    const auto put = [&](const char *piece) {
        to == channel::lines ? sink.line(piece) : sink.failure(piece);
    };
    if (text)
        put(text);
    if (newline == trailing_newline::yes)
        put("\n");
    cu_rel_error_1(err);
    cu_rel_errmsg_1(text);
    cu_set_no_error_1();
}

void put_line(dump_sink &sink, trailing_newline newline) {
    put_record(sink, channel::lines, newline);
}

// A failure to read a part of the buffer. It goes where the failure to turn
// a sub-ACL into entries goes, so that every structural fault of a dumped
// buffer shows up in one channel.
void put_failure(dump_sink &sink) {
    put_record(sink, channel::failures, trailing_newline::no);
}

struct tree_deleter {
    void operator()(sec_acltree_t tree) const noexcept { sec__free_acltree(tree); }
};
using unique_tree = std::unique_ptr<sec_acltree_desc, tree_deleter>;

// The mechanism of a sub-ACL header as a text, read only within its field.
struct subacl_mech_text {
    char text[256] = {};
    explicit subacl_mech_text(const subacl_view &v) {
        if (v.mech)
            std::memcpy(text, v.mech, v.mech_length);
    }
};

// The lead space of a sub-ACL's entries: its own and one more tab. Empty
// (and reported) when memory ran out.
unique_mem<char> entry_leadspace(const char *leadspace) {
    std::size_t length = std::strlen(leadspace);
    unique_mem<char> lead(static_cast<char *>(mem_alloc(length + 2)));
    if (!lead) {
        no_memory("sec__dump_subacl", length + 2);
        return lead;
    }
    std::memcpy(lead.get(), leadspace, length);
    lead.get()[length] = '\t';
    lead.get()[length + 1] = '\0';
    return lead;
}

// Sets the record to the line of an entry that could be displayed.
void report_acle_line(const sec_acle_t acle, const char *mech, const char *id, const char *perms,
                      const char *leadspace) {
    char letter = type_letter(acle->type);
    if (type_has_mech(acle->type))
        report<MSG_DUMP_ACLE_MECH>(dump_line, leadspace, letter, mech, id, perms);
    else if (type_has_id(acle->type))
        report<MSG_DUMP_ACLE_ID>(dump_line, leadspace, letter, id, perms);
    else
        report<MSG_DUMP_ACLE>(dump_line, leadspace, letter, perms);
}

} // namespace

void stream_sink::put(std::FILE *stream, const char *text) noexcept {
    if (!stream)
        return;
    std::fputs(text, stream);
    std::fflush(stream);
}

void sec__dump_acle(sec_acle_t acle, sec_perm_set_t ptplset, const char *leadspace,
                    dump_sink &sink) {
    if (!acle)
        return;
    char *mech = nullptr;
    char *id = nullptr;
    kx_int32_t rc = sec_display_acle_id(acle, &mech, &id);
    unique_mem<char> own_mech(mech), own_id(id);
    char perms[max_perm_text] = {};
    if (rc == SEC_S_OK)
        rc = sec_translate_bitmask(acle->perm, ptplset, perms);
    // A failure takes the place of the line, so the entry still shows.
    if (rc == SEC_S_OK)
        report_acle_line(acle, mech, id, perms, leadspace);
    put_line(sink, trailing_newline::no);
}

void sec__dump_acle(sec_acle_t acle, sec_perm_set_t ptplset, const char *leadspace) {
    stream_sink sink(stderr, stdout);
    sec__dump_acle(acle, ptplset, leadspace, sink);
}

void sec__dump_acltree(sec_acltree_t tree, const char *leadspace, dump_sink &sink) {
    walk_acltree(tree, [&](sec_acltree_node_s *node) {
        sec__dump_acle(node->sat_acle, nullptr, leadspace, sink);
        return SEC_S_OK;
    });
}

void sec__dump_subacl(acl_bytes b, const subacl_view &v, const char *leadspace, dump_sink &sink) {
    subacl_mech_text mech(v);
    report<MSG_DUMP_SUBACL>(dump_line, leadspace, leadspace, v.length, v.type,
                            static_cast<const char *>(mech.text), v.count);
    put_line(sink, trailing_newline::yes);

    sec_acltree_t built = nullptr;
    if (sec__subacl_to_acltree(b, v, &built) != SEC_S_OK) {
        put_failure(sink);
        return;
    }
    unique_tree tree(built);
    unique_mem<char> lead = entry_leadspace(leadspace);
    if (!lead) {
        put_failure(sink);
        return;
    }
    sec__dump_acltree(tree.get(), lead.get(), sink);
}

// Reads nothing outside the descriptor's length: a header or sub-ACL that
// runs past it gives 2650-110 and ends the dump.
void dump_acl(sec_acl_buffer_t acl, dump_sink &sink) noexcept {
    // A negative length holds no bytes either.
    if (!acl || acl->length <= 0 || !acl->value)
        return;
    acl_bytes b = bytes_of(*acl);
    if (b.data[layout::at_buffer_type] != layout::buffer_type) {
        report<MSG_DUMP_INVALID>(dump_line);
        put_line(sink, trailing_newline::yes);
        return;
    }
    if (b.size < layout::header_size) {
        report_corrupt(here(src_acl));
        put_failure(sink);
        return;
    }
    char length_text[16];
    std::snprintf(length_text, sizeof length_text, "%d", static_cast<int>(acl->length));
    unsigned count = subacl_count(b);
    report<MSG_DUMP_ACL>(dump_line, static_cast<const char *>(length_text),
                         b.data[layout::at_version], b.data[layout::at_byte_order], count);
    put_line(sink, trailing_newline::no);

    kx_int32_t rc = walk_subacls(b, records_bound::next_subacl,
                                 [&](const subacl_view &v, acl_bytes records, bool) {
                                     sec__dump_subacl(records, v, "\t", sink);
                                     return SEC_S_OK;
                                 });
    if (rc != SEC_S_OK)
        put_failure(sink);
}

} // namespace kxacl

using namespace kxacl;

// Lines on standard error, failures on standard output.
extern "C" ACL_EXTERN void sec__dump_acl(sec_acl_buffer_t acl) noexcept {
    stream_sink sink(stderr, stdout);
    dump_acl(acl, sink);
}

extern "C" ACL_EXTERN void sec__dump_acl_to(sec_acl_buffer_t acl, FILE *lines,
                                            FILE *failures) noexcept {
    stream_sink sink(lines, failures);
    dump_acl(acl, sink);
}
