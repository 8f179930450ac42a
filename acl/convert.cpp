// Conversion between sub-ACLs, entry trees and entry lists.
#include "convert.h"

#include <algorithm>
#include <cstring>

#include "alloc.h"
#include "byteorder.h"
#include "posix_case.h"
#include "entries.h"
#include "report.h"

namespace kxacl {

namespace {

// The mechanism of a user or expanded sub-ACL as a text that fits an
// entry's field; a longer or unterminated one is refused before any copy.
kx_int32_t subacl_mech(const subacl_view &v, const char **mech) {
    *mech = "";
    if (!type_has_mech(v.type))
        return SEC_S_OK;
    if (v.mech_length < 2 || v.mech_length > layout::max_mech_length) {
        source_pos pos = here(src_acl);
        return report<MSG_2650_123>(SEC_S_BAD_ACL, v.mech_length, pos.file, pos.line);
    }
    if (v.mech[v.mech_length - 1] != '\0')
        return report_corrupt(here(src_acl));
    *mech = v.mech;
    return SEC_S_OK;
}

// Adds the entry of one record to the tree, which copies it: the record's
// identifier is used where it stands in the buffer.
kx_int32_t add_record(const subacl_view &v, const char *mech, const acle_record &e,
                      sec_acltree_t *tree) {
    sec_acle_desc entry{};
    entry.perm = e.perm();
    entry.type = v.type;
    std::memcpy(entry.mech, mech, std::strlen(mech) + 1);
    if (type_has_id(v.type)) {
        // The identifier must end within its record to be read as a text.
        if (!e.id_terminated())
            return report_corrupt(here(src_acl));
        entry.id = const_cast<char *>(e.id);
    }
    return sec__add_acle_to_tree(0, &entry, tree);
}

std::size_t subacl_header_length(sec_acltree_t tree) {
    return type_has_mech(tree->sat_type)
               ? layout::subacl_header_size + std::strlen(tree->sat_mech) + 1
               : layout::subacl_header_size;
}

// The size of the tree's sub-ACL, 0 when it holds no entry. An identifier
// that its length field cannot hold, or a sub-ACL beyond a buffer's reach,
// is refused rather than written cut short.
kx_int32_t subacl_length(sec_acltree_t tree, std::size_t *length) {
    *length = 0;
    std::size_t total = 0;
    kx_int32_t rc = walk_acltree(tree, [&](sec_acltree_node_s *n) {
        std::size_t record = layout::acle_header_size + n->sat_id_size;
        if (n->sat_id_size > layout::max_id_length)
            return report<MSG_2650_117>(SEC_S_BAD_ACLE, n->sat_acle->type);
        total += record;
        if (total > layout::max_buffer_length)
            return no_memory("sec__acltree_to_subacl", total);
        return SEC_S_OK;
    });
    if (rc == SEC_S_OK && total > 0)
        *length = total + subacl_header_length(tree);
    return rc;
}

// Writes the sub-ACL of a tree that holds entries at out, in one walk, and
// gives its length (the one that subacl_length gave to size out).
std::size_t write_subacl(sec_acltree_t tree, unsigned char *out) {
    std::size_t offset = subacl_header_length(tree);
    std::memset(out, 0, offset);
    out[layout::at_subacl_type] = tree->sat_type;
    if (type_has_mech(tree->sat_type)) {
        out[layout::at_mech_length] = static_cast<unsigned char>(offset - layout::at_mech);
        std::memcpy(out + layout::at_mech, tree->sat_mech, offset - layout::at_mech);
    }
    std::uint32_t count = 0;
    walk_acltree(tree, [&](sec_acltree_node_s *n) {
        const sec_acle_t acle = n->sat_acle;
        unsigned char *record = out + offset;
        std::size_t id_length = n->sat_id_size;
        record[layout::at_acle_version] = layout::acle_version;
        store_u32(record + layout::at_perm, acle->perm);
        store_u16(record + layout::at_id_length, static_cast<std::uint16_t>(id_length));
        if (id_length)
            std::memcpy(record + layout::at_id, acle->id, id_length);
        offset += layout::acle_header_size + id_length;
        ++count;
        return SEC_S_OK;
    });
    store_u32(out + layout::at_subacl_length, static_cast<std::uint32_t>(offset));
    store_u32(out + layout::at_acle_count, count);
    return offset;
}

} // namespace

kx_int32_t sec__subacl_to_acltree(acl_bytes b, const subacl_view &v, sec_acltree_t *tree) {
    *tree = nullptr;
    if (!type_has_id(v.type) && v.count > 1)
        return report<MSG_2650_111>(SEC_S_BAD_ACL);
    const char *mech = nullptr;
    kx_int32_t rc = subacl_mech(v, &mech);
    if (rc == SEC_S_OK)
        rc = walk_acles(b, v, [&](const acle_record &e) { return add_record(v, mech, e, tree); });
    if (rc != SEC_S_OK) {
        sec__free_acltree(*tree);
        *tree = nullptr;
    }
    return rc;
}

kx_int32_t sec__acltree_to_subacl(const sec_acltree_t tree, unsigned char **subacl,
                                  std::size_t *length) {
    *subacl = nullptr;
    kx_int32_t rc = subacl_length(tree, length);
    if (rc != SEC_S_OK || *length == 0)
        return rc;
    auto *out = static_cast<unsigned char *>(mem_alloc(*length));
    if (!out)
        return no_memory("sec__acltree_to_subacl", *length);
    write_subacl(tree, out);
    *subacl = out;
    return SEC_S_OK;
}

kx_int32_t sec__acltrees_to_acl(sec_acltree_t *acltrees, kx_int32_t count, sec_acl_buffer_t acl) {
    acl->length = 0;
    acl->value = nullptr;
    // Sizes first, so that the buffer is allocated once.
    std::size_t total = layout::header_size, subacls = 0;
    for (kx_int32_t i = count - 1; i >= 0; --i) {
        std::size_t length = 0;
        kx_int32_t rc = subacl_length(acltrees[i], &length);
        if (rc != SEC_S_OK)
            return rc;
        total += length;
        subacls += length > 0;
        if (total > layout::max_buffer_length || subacls > layout::max_subacls)
            return no_memory("sec__acltrees_to_acl", total);
    }
    sec_buffer_s header{};
    if (!new_empty_buffer(&header))
        return no_memory("sec__acltrees_to_acl", layout::header_size);
    auto *out = static_cast<unsigned char *>(mem_realloc(header.value, total));
    if (!out) {
        std::free(header.value);
        return no_memory("sec__acltrees_to_acl", total);
    }
    store_u16(out + layout::at_subacl_count, static_cast<std::uint16_t>(subacls));
    std::size_t offset = layout::header_size;
    for (kx_int32_t i = count - 1; i >= 0; --i)
        if (tree_has_entry(acltrees[i]))
            offset += write_subacl(acltrees[i], out + offset);
    acl->value = out;
    acl->length = static_cast<kx_int32_t>(total);
    return SEC_S_OK;
}

namespace {

// Makes room for more entries at the end of the list: the list grows once
// per sub-ACL.
kx_int32_t grow_list(sec_acle_list_t list, std::size_t more) {
    // A list without entries has no array: releasing it frees none.
    if (more == 0)
        return SEC_S_OK;
    std::size_t count = static_cast<std::size_t>(list->count);
    if (count + more > 0x7fffffff)
        return no_memory("sec__acltree_to_aclelist", (count + more) * sizeof(sec_acle_t));
    std::size_t bytes = (count + more) * sizeof(sec_acle_t);
    auto *grown = static_cast<sec_acle_t *>(mem_realloc(list->acles, bytes));
    if (!grown)
        return no_memory("sec__acltree_to_aclelist", bytes);
    list->acles = grown;
    return SEC_S_OK;
}

// Appends a copy of acle with the id_size bytes of id as its identifier,
// as an entry of its own, to a list with room for it.
kx_int32_t append_copy(sec_acle_list_t list, const sec_acle_desc &acle, const char *id,
                       std::size_t id_size) {
    sec_acle_t copy = copy_acle_in_one_block(acle, id, id_size);
    if (!copy)
        return no_memory("sec__acltree_to_aclelist", one_block_size(id_size));
    list->acles[list->count++] = copy;
    return SEC_S_OK;
}

// The length of the identifier of record e with its NUL, which lies in the
// field (id_terminated).
std::size_t id_size_of(const acle_record &e) {
    return static_cast<std::size_t>(std::find(e.id, e.id + e.id_length, '\0') - e.id) + 1;
}

// A user or group sub-ACL whose records are readable and whose identifiers
// stand in strictly ascending order, as the library's writers leave them,
// holds no two entries of one identity: a tree would find no duplicate to
// merge and would give the entries back in the order they stand.
bool strictly_ascending(acl_bytes b, const subacl_view &v) {
    if (v.type != SEC_ACLE_USER && v.type != SEC_ACLE_GROUP)
        return false;
    const char *previous = nullptr;
    std::size_t previous_size = 0;
    bool ascending = true;
    kx_int32_t rc = walk_acles(b, v, [&](const acle_record &e) {
        if (!e.id_terminated()) {
            ascending = false;
            return walk_stop;
        }
        const std::size_t size = id_size_of(e);
        ascending = !previous || kx::posix_case::compare(previous, previous_size, e.id, size) < 0;
        previous = e.id;
        previous_size = size;
        return ascending ? SEC_S_OK : walk_stop;
    });
    // A record past the end is left for the tree's walk to report.
    if (rc != SEC_S_OK)
        cu_set_no_error_1();
    return rc == SEC_S_OK && ascending;
}

// Appends the entries of such a sub-ACL as they stand.
kx_int32_t append_ascending(acl_bytes b, const subacl_view &v, const char *mech,
                            sec_acle_list_t list) {
    kx_int32_t rc = grow_list(list, v.count);
    sec_acle_desc entry{};
    entry.type = v.type;
    std::memcpy(entry.mech, mech, std::strlen(mech) + 1);
    if (rc != SEC_S_OK)
        return rc;
    return walk_acles(b, v, [&](const acle_record &e) {
        entry.perm = e.perm();
        return append_copy(list, entry, e.id, id_size_of(e));
    });
}

} // namespace

kx_int32_t sec__acltree_to_aclelist(sec_acltree_t tree, sec_acle_list_t aclelist) {
    std::size_t moving = tree_entry_count(tree);
    if (moving == 0)
        return SEC_S_OK;
    kx_int32_t rc = grow_list(aclelist, moving);
    if (rc != SEC_S_OK)
        return rc;
    // The entries live in the tree's blocks: each goes to the list as an
    // entry of its own, in one block with its identifier.
    return walk_acltree(tree, [&](sec_acltree_node_s *n) {
        kx_int32_t copied = append_copy(aclelist, *n->sat_acle, n->sat_acle->id, n->sat_id_size);
        if (copied == SEC_S_OK)
            n->sat_acle = nullptr;
        return copied;
    });
}

kx_int32_t append_subacl_to_list(acl_bytes b, const subacl_view &v, sec_acle_list_t list) {
    if (strictly_ascending(b, v)) {
        // The mechanism is checked as reading into a tree checks it first.
        const char *mech = nullptr;
        kx_int32_t rc = subacl_mech(v, &mech);
        return rc != SEC_S_OK ? rc : append_ascending(b, v, mech, list);
    }
    sec_acltree_t tree = nullptr;
    kx_int32_t rc = sec__subacl_to_acltree(b, v, &tree);
    if (rc == SEC_S_OK)
        rc = sec__acltree_to_aclelist(tree, list);
    sec__free_acltree(tree);
    return rc;
}

} // namespace kxacl
