// Entry trees: the entries of one sub-ACL while an ACL is built or changed,
// kept in the order that the buffer format requires and free of duplicates.
//
// A tree keeps its nodes in insertion order, as its node blocks hand them
// out, and finds the node of an identity (case-insensitive in the POSIX
// locale) without a walk: while identities arrive in strictly ascending
// order, as they do from a buffer or a sorted file, a new one need only be
// compared with the last, and the insertion order is the identity order;
// the first identity out of order gives the tree a hash index of its nodes
// and a list of them that is sorted when it is next walked. Compiling a
// shuffled file of a million lines then costs one probe of the index per
// line and one sort, instead of a walk down a tree whose lower levels are
// all cache misses. User and group entries are written in identity order,
// expanded entries in insertion order. Nothing recurses.
//
// Compiling a large ACL file makes one node per line, so a node costs no
// allocation of its own: nodes, each with its entry inside it, come from
// blocks of growing size that the tree owns, and the identifiers are copied
// one after another into text blocks of the tree. Every node carries the
// first eight folded bytes of its identifier as a number, which decides
// most comparisons without reaching the identifier itself.
#ifndef KXACL_TREE_H
#define KXACL_TREE_H

#include <cstddef>
#include <cstdint>

#include <kx_acl.h>

namespace kxacl {

// One node; a node whose entry was deleted, or moved to a list as a copy,
// keeps its place with a null entry.
struct sec_acltree_node_s {
    sec_acle_t sat_acle;       // &sat_entry, or null
    std::uint64_t sat_key;     // the identifier's sort key (posix_case.h)
    std::uint32_t sat_id_size; // the identifier's length with its NUL; 0 without one
    std::uint32_t sat_hash;    // of the folded identifier, for the index
    sec_acle_desc sat_entry;   // its identifier lies in a text block of the tree
};

// A node in the identity order list, with its key beside it so that sorting
// the list reads the nodes themselves only for keys that are equal.
struct sec_acltree_ordered_s {
    std::uint64_t key;
    sec_acltree_node_s *node;
};

// A block of nodes, handed out in insertion order. The nodes follow it.
struct sec_acltree_block_s {
    sec_acltree_block_s *next;
    std::uint32_t used;
    std::uint32_t capacity;
    sec_acltree_node_s *nodes() { return reinterpret_cast<sec_acltree_node_s *>(this + 1); }
};

// A block of identifiers, each with its NUL, one after another. The bytes
// follow it.
struct sec_acltree_text_s {
    sec_acltree_text_s *next;
    std::size_t used;
    std::size_t capacity;
    char *bytes() { return reinterpret_cast<char *>(this + 1); }
};

// A tree of one sub-ACL key. The key is that of its first entry, whose
// mechanism spelling the sub-ACL keeps. A null sec_acltree_t is the empty tree.
typedef struct sec_acltree_s {
    sec_acltree_block_s *sat_blocks;     // the first block
    sec_acltree_block_s *sat_last_block; // the one new nodes come from
    sec_acltree_text_s *sat_texts;       // the one new identifiers go to first
    std::size_t sat_count;               // nodes, with or without entry
    sec_acltree_node_s *sat_last;        // the node inserted last
    // Null while the nodes stand in strictly ascending identity order; then
    // sat_slots (a power of two) node pointers, null where free, and the
    // list of every node, of which the first sat_sorted are in order.
    sec_acltree_node_s **sat_index;
    std::size_t sat_slots;
    sec_acltree_ordered_s *sat_order;
    std::size_t sat_order_room;
    std::size_t sat_sorted;
    unsigned char sat_type;
    char sat_mech[SEC_MECH_MAX + 1];
} sec_acltree_desc, *sec_acltree_t;

// Inserts a copy of acle into the tree at *tree (made when empty). With
// single, an entry of the same identity is a failure (2650-157/174/175);
// without, that entry takes acle's mask. The tree is unchanged on failure.
kx_int32_t sec__add_acle_to_tree(sec_boolean_t single, const sec_acle_t acle, sec_acltree_t *tree);

// Puts acle into the tree of its sub-ACL key in the array, adding a tree at
// the end for a new key. Always refuses duplicates.
kx_int32_t sec__add_acle_to_trees(const sec_acle_t acle, sec_acltree_t **trees, int *nooftrees);

// Releases the entry of acle's identity, leaving its node with a null entry.
kx_int32_t sec__del_acle_from_tree(const sec_acle_t acle, sec_acltree_t tree);

// Releases the tree, its nodes and the entries still in it. Null is accepted.
void sec__free_acltree(sec_acltree_t tree);

// Frees an array of trees, from the last to the first, and the array.
void free_acltrees(sec_acltree_t *trees, int count);

// Whether any node still holds an entry.
bool tree_has_entry(sec_acltree_t tree);

// Number of nodes that still hold an entry.
std::size_t tree_entry_count(sec_acltree_t tree);

// Calls visit(node) for each node holding an entry, in the order of the
// sub-ACL: identity order for user and group trees, insertion order for the
// others. Stops at the first status other than SEC_S_OK and returns it.
template <typename Visit> kx_int32_t walk_acltree(sec_acltree_t tree, Visit &&visit);

// Sorts the identity order list of a tree that has one, if it is not.
void sort_acltree(sec_acltree_t tree);

namespace detail {
// Calls visit(n) when n still holds an entry; SEC_S_OK for one that does not.
template <typename Visit> kx_int32_t visit_held(sec_acltree_node_s *n, Visit &visit) {
    return n->sat_acle ? visit(n) : SEC_S_OK;
}
} // namespace detail

template <typename Visit> kx_int32_t walk_acltree(sec_acltree_t tree, Visit &&visit) {
    if (!tree)
        return SEC_S_OK;
    kx_int32_t rc = SEC_S_OK;
    if ((tree->sat_type == SEC_ACLE_USER || tree->sat_type == SEC_ACLE_GROUP) && tree->sat_order) {
        sort_acltree(tree);
        for (std::size_t i = 0; rc == SEC_S_OK && i < tree->sat_count; ++i)
            rc = detail::visit_held(tree->sat_order[i].node, visit);
        return rc;
    }
    for (sec_acltree_block_s *b = tree->sat_blocks; b; b = b->next)
        for (std::uint32_t i = 0; rc == SEC_S_OK && i < b->used; ++i)
            rc = detail::visit_held(&b->nodes()[i], visit);
    return rc;
}

} // namespace kxacl

#endif
