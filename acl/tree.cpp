// Entry trees: insertion with the duplicate rules, deletion, freeing.
#include "tree.h"

#include <algorithm>
#include <cstring>

#include "alloc.h"
#include "posix_case.h"
#include "entries.h"
#include "frame.h"
#include "report.h"

namespace kxacl {

namespace {

namespace posix_case = kx::posix_case;
using node = sec_acltree_node_s;
using node_block = sec_acltree_block_s;
using tree_text = sec_acltree_text_s;
using ordered = sec_acltree_ordered_s;

// Nodes per block: the first block is small, for the many trees of one or a
// few entries that editing makes; each next one doubles, up to a size that
// keeps the block's waste small next to a large tree.
constexpr std::uint32_t first_block_nodes = 8;
constexpr std::uint32_t largest_block_nodes = 4096;
// Text blocks grow the same way, in bytes; a longer identifier gets a
// block of its own size.
constexpr std::size_t first_text_bytes = 256;
constexpr std::size_t largest_text_bytes = 65536;
// The index starts with this many slots and keeps at least half of them
// free; the order list starts with this much room.
constexpr std::size_t first_slots = 16;
constexpr std::size_t first_order_room = 16;

// The identity of an entry being looked up, measured once.
struct probe {
    const char *id;
    std::uint32_t size; // with the NUL; 0 without identifier
    std::uint64_t key;
    std::uint32_t hash;

    explicit probe(const sec_acle_t acle) {
        id = type_has_id(acle->type) ? (acle->id ? acle->id : "") : nullptr;
        size = id ? static_cast<std::uint32_t>(std::strlen(id) + 1) : 0;
        key = id ? posix_case::sort_key(id, size) : 0;
        hash = id ? static_cast<std::uint32_t>(posix_case::folded_hash(id, size)) : 0;
    }
};

// Orders two identifiers (of size bytes each, NUL included) whose sort keys
// are known, as cu_strcasecmp_posix_1 orders them. Equal keys of a text that
// ends within them are equal texts; otherwise both go on past the key.
int order_ids(std::uint64_t key_a, const char *a, std::size_t size_a, std::uint64_t key_b,
              const char *b, std::size_t size_b) {
    if (key_a != key_b)
        return key_a < key_b ? -1 : 1;
    if (size_a <= 8 || size_b <= 8)
        return size_a == size_b ? 0 : size_a < size_b ? -1 : 1;
    return posix_case::compare(a + 8, size_a - 8, b + 8, size_b - 8);
}

// The node's identifier stays in the text blocks when its entry is deleted.
int order(const probe &p, const node *n) {
    return order_ids(p.key, p.id, p.size, n->sat_key, n->sat_entry.id, n->sat_id_size);
}

bool same_identity(const probe &p, const node *n) {
    return n->sat_hash == p.hash && n->sat_id_size == p.size && order(p, n) == 0;
}

// Where a look-up for an identity ended.
enum class lookup {
    absent,    // and a new node for it may be added last
    found,     // *found holds it
    unindexed, // the tree needs its index to tell
};

// Looks the probe's identity up in the index.
lookup find_indexed(sec_acltree_t tree, const probe &p, node **found) {
    std::size_t mask = tree->sat_slots - 1;
    for (std::size_t i = p.hash & mask; node *n = tree->sat_index[i]; i = (i + 1) & mask)
        if (same_identity(p, n)) {
            *found = n;
            return lookup::found;
        }
    return lookup::absent;
}

// Trees without identities hold one node, which is every entry's. While
// the nodes ascend, an identity after the last one is new.
lookup find(sec_acltree_t tree, const probe &p, node **found) {
    *found = nullptr;
    if (tree->sat_count == 0)
        return lookup::absent;
    if (!p.id) {
        *found = &tree->sat_blocks->nodes()[0];
        return lookup::found;
    }
    if (tree->sat_index)
        return find_indexed(tree, p, found);
    int c = order(p, tree->sat_last);
    if (c > 0)
        return lookup::absent;
    if (c < 0)
        return lookup::unindexed;
    *found = tree->sat_last;
    return lookup::found;
}

// Puts a node into a free slot of an index with room for it.
void index_node(node **slots, std::size_t count, node *n) {
    std::size_t mask = count - 1;
    std::size_t i = n->sat_hash & mask;
    while (slots[i])
        i = (i + 1) & mask;
    slots[i] = n;
}

// An index of the tree's nodes with room for `nodes` of them.
node **new_index(sec_acltree_t tree, std::size_t nodes, std::size_t *slots) {
    std::size_t count = first_slots;
    while (count < 2 * nodes)
        count *= 2;
    std::size_t bytes = count * sizeof(node *);
    auto **index = static_cast<node **>(mem_zalloc(bytes));
    if (!index) {
        no_memory("sec__add_acle_to_tree", bytes);
        return nullptr;
    }
    for (node_block *b = tree->sat_blocks; b; b = b->next)
        for (std::uint32_t i = 0; i < b->used; ++i)
            index_node(index, count, &b->nodes()[i]);
    *slots = count;
    return index;
}

// Gives the tree of ascending nodes its index and its order list, with
// room for one node more; the tree is unchanged on failure.
kx_int32_t make_index(sec_acltree_t tree) {
    std::size_t room = std::max(first_order_room, 2 * tree->sat_count);
    std::size_t bytes = room * sizeof(ordered);
    unique_mem<ordered> list(static_cast<ordered *>(mem_alloc(bytes)));
    if (!list)
        return no_memory("sec__add_acle_to_tree", bytes);
    std::size_t slots = 0;
    node **index = new_index(tree, tree->sat_count + 1, &slots);
    if (!index)
        return SEC_S_NO_MEMORY;
    std::size_t at = 0;
    for (node_block *b = tree->sat_blocks; b; b = b->next)
        for (std::uint32_t i = 0; i < b->used; ++i)
            list.get()[at++] = ordered{b->nodes()[i].sat_key, &b->nodes()[i]};
    tree->sat_index = index;
    tree->sat_slots = slots;
    tree->sat_order = list.release();
    tree->sat_order_room = room;
    tree->sat_sorted = tree->sat_count;
    return SEC_S_OK;
}

// Makes room in an indexed tree for one node more.
kx_int32_t reserve_indexed(sec_acltree_t tree) {
    if (2 * (tree->sat_count + 1) > tree->sat_slots) {
        std::size_t slots = 0;
        node **index = new_index(tree, tree->sat_count + 1, &slots);
        if (!index)
            return SEC_S_NO_MEMORY;
        std::free(tree->sat_index);
        tree->sat_index = index;
        tree->sat_slots = slots;
    }
    if (tree->sat_count + 1 > tree->sat_order_room) {
        std::size_t room = 2 * tree->sat_order_room;
        std::size_t bytes = room * sizeof(ordered);
        auto *list = static_cast<ordered *>(mem_realloc(tree->sat_order, bytes));
        if (!list)
            return no_memory("sec__add_acle_to_tree", bytes);
        tree->sat_order = list;
        tree->sat_order_room = room;
    }
    return SEC_S_OK;
}

// Records a node just added: last, and in the index and the order list.
void note_node(sec_acltree_t tree, const probe &p, node *n) {
    if (tree->sat_index) {
        index_node(tree->sat_index, tree->sat_slots, n);
        // The list stays sorted while nodes keep coming in ascending order.
        if (tree->sat_sorted == tree->sat_count && order(p, tree->sat_last) > 0)
            ++tree->sat_sorted;
        tree->sat_order[tree->sat_count] = ordered{n->sat_key, n};
    }
    ++tree->sat_count;
    tree->sat_last = n;
}

const char *type_word(unsigned type) {
    switch (type) {
    case SEC_ACLE_UNAUTHENTICATED:
        return "unauthenticated";
    case SEC_ACLE_ANYOTHER:
        return "anyother";
    case SEC_ACLE_USER:
        return "user";
    case SEC_ACLE_EXPANDED:
        return "user-expanded";
    default:
        return "group";
    }
}

kx_int32_t report_duplicate(const sec_acle_t acle) {
    unsigned char letter = static_cast<unsigned char>(type_letter(acle->type));
    if (!type_has_id(acle->type))
        return report<MSG_2650_174>(SEC_S_BAD_ACLE, letter);
    if (acle->type == SEC_ACLE_GROUP)
        return report<MSG_2650_175>(SEC_S_BAD_ACLE, letter, acle->id);
    return report<MSG_2650_157>(SEC_S_BAD_ACLE, letter, acle->mech, acle->id);
}

// The same identity again: refused, or its mask replaced.
kx_int32_t merge_duplicate(sec_boolean_t single, const sec_acle_t acle, node *existing) {
    if (single)
        return report_duplicate(acle);
    sec_acle_t stored = existing->sat_acle;
    stored->perm = acle->perm;
    if (wanted<KX_ACL_TP_TREE_DUPLICATE>())
        trace<KX_ACL_TP_TREE_DUPLICATE>(text(type_word(stored->type)),
                                        text(type_has_mech(stored->type) ? stored->mech : "<none>"),
                                        text(stored->id));
    return SEC_S_OK;
}

// Makes sure that the tree's last block has room for one more node.
kx_int32_t reserve_node(sec_acltree_t tree) {
    node_block *last = tree->sat_last_block;
    if (last && last->used < last->capacity)
        return SEC_S_OK;
    std::uint32_t capacity =
        last ? std::min(2 * last->capacity, largest_block_nodes) : first_block_nodes;
    std::size_t bytes = sizeof(node_block) + capacity * sizeof(node);
    auto *fresh = static_cast<node_block *>(mem_alloc(bytes));
    if (!fresh)
        return no_memory("sec__add_acle_to_tree", bytes);
    *fresh = node_block{nullptr, 0, capacity};
    if (last)
        last->next = fresh;
    else
        tree->sat_blocks = fresh;
    tree->sat_last_block = fresh;
    return SEC_S_OK;
}

// A copy of the size bytes at text in the tree's text blocks, or null when
// no block can be had (reported).
char *store_text(sec_acltree_t tree, const char *text, std::size_t size) {
    tree_text *head = tree->sat_texts;
    if (!head || head->capacity - head->used < size) {
        std::size_t capacity =
            head ? std::min(2 * head->capacity, largest_text_bytes) : first_text_bytes;
        capacity = std::max(capacity, size);
        std::size_t bytes = sizeof(tree_text) + capacity;
        auto *fresh = static_cast<tree_text *>(mem_alloc(bytes));
        if (!fresh) {
            no_memory("sec__add_acle_to_tree", bytes);
            return nullptr;
        }
        *fresh = tree_text{head, 0, capacity};
        tree->sat_texts = head = fresh;
    }
    char *copy = head->bytes() + head->used;
    std::memcpy(copy, text, size);
    head->used += size;
    return copy;
}

// Takes the reserved node and gives it a copy of acle.
kx_int32_t make_node(sec_acltree_t tree, const sec_acle_t acle, const probe &p, node **out) {
    kx_int32_t rc = reserve_node(tree);
    if (rc != SEC_S_OK)
        return rc;
    char *id = nullptr;
    if (p.id && !(id = store_text(tree, p.id, p.size)))
        return SEC_S_NO_MEMORY;
    node_block *block = tree->sat_last_block;
    node *n = &block->nodes()[block->used++];
    *n = node{nullptr, p.key, p.size, p.hash, sec_acle_desc{}};
    n->sat_entry.perm = acle->perm;
    n->sat_entry.type = acle->type;
    // The last byte of the field stays NUL.
    if (type_has_mech(acle->type))
        std::memcpy(n->sat_entry.mech, acle->mech, SEC_MECH_MAX);
    n->sat_entry.id = id;
    n->sat_acle = &n->sat_entry;
    *out = n;
    return SEC_S_OK;
}

// A new empty tree whose key is acle's.
kx_int32_t make_tree(const sec_acle_t acle, sec_acltree_t *tree) {
    auto *t = static_cast<sec_acltree_t>(mem_zalloc(sizeof(sec_acltree_desc)));
    if (!t)
        return no_memory("sec__add_acle_to_tree", sizeof(sec_acltree_desc));
    t->sat_type = acle->type;
    if (type_has_mech(acle->type))
        std::memcpy(t->sat_mech, acle->mech, SEC_MECH_MAX);
    *tree = t;
    return SEC_S_OK;
}

// The tree holds acle's sub-ACL key.
bool tree_has_key(sec_acltree_t tree, const sec_acle_t acle) {
    if (tree->sat_type != acle->type)
        return false;
    // Both fields end in a NUL within their bytes (an entry's last byte
    // may be its only one), so they compare as texts without a call.
    return !type_has_mech(acle->type) || posix_case::compare(tree->sat_mech, sizeof tree->sat_mech,
                                                             acle->mech, sizeof acle->mech) == 0;
}

} // namespace

kx_int32_t sec__add_acle_to_tree(sec_boolean_t single, const sec_acle_t acle, sec_acltree_t *tree) {
    bool made_tree = false;
    if (!*tree) {
        kx_int32_t rc = make_tree(acle, tree);
        if (rc != SEC_S_OK)
            return rc;
        made_tree = true;
    }
    sec_acltree_t t = *tree;
    probe p(acle);
    node *existing = nullptr;
    lookup outcome = find(t, p, &existing);
    if (outcome == lookup::unindexed) {
        kx_int32_t rc = make_index(t);
        if (rc != SEC_S_OK)
            return rc;
        outcome = find_indexed(t, p, &existing);
    }
    if (outcome == lookup::found) {
        // Deleted nodes are followed by a write or a free, never by an
        // insertion: meeting one here is a misuse.
        if (!existing->sat_acle)
            return internal_error(here(src_acl), 0);
        return merge_duplicate(single, acle, existing);
    }
    kx_int32_t rc = t->sat_index ? reserve_indexed(t) : SEC_S_OK;
    node *fresh = nullptr;
    if (rc == SEC_S_OK)
        rc = make_node(t, acle, p, &fresh);
    if (rc != SEC_S_OK) {
        if (made_tree) {
            sec__free_acltree(t);
            *tree = nullptr;
        }
        return rc;
    }
    note_node(t, p, fresh);
    return SEC_S_OK;
}

kx_int32_t sec__add_acle_to_trees(const sec_acle_t acle, sec_acltree_t **trees, int *nooftrees) {
    for (int i = 0; i < *nooftrees; ++i)
        if ((*trees)[i] && tree_has_key((*trees)[i], acle))
            return sec__add_acle_to_tree(1, acle, &(*trees)[i]);
    std::size_t bytes = (static_cast<std::size_t>(*nooftrees) + 1) * sizeof(sec_acltree_t);
    auto *grown = static_cast<sec_acltree_t *>(mem_realloc(*trees, bytes));
    if (!grown)
        return no_memory("sec__add_acle_to_trees", bytes);
    *trees = grown;
    grown[*nooftrees] = nullptr;
    ++*nooftrees;
    return sec__add_acle_to_tree(1, acle, &grown[*nooftrees - 1]);
}

kx_int32_t sec__del_acle_from_tree(const sec_acle_t acle, sec_acltree_t tree) {
    node *found = nullptr;
    if (tree) {
        probe p(acle);
        if (find(tree, p, &found) == lookup::unindexed) {
            // Before the last of ascending nodes: a walk of them finds it
            // without building an index for one deletion.
            for (node_block *b = tree->sat_blocks; b && !found; b = b->next)
                for (std::uint32_t i = 0; i < b->used && !found; ++i)
                    if (same_identity(p, &b->nodes()[i]))
                        found = &b->nodes()[i];
        }
    }
    if (!found || !found->sat_acle) {
        const char *mech = type_has_mech(acle->type) ? acle->mech : "";
        const char *id = type_has_id(acle->type) && acle->id ? acle->id : "";
        return report<MSG_2650_118>(SEC_S_ACLE_NOT_FOUND, acle->type, mech, id);
    }
    found->sat_acle = nullptr;
    return SEC_S_OK;
}

void sec__free_acltree(sec_acltree_t tree) {
    if (!tree)
        return;
    // Nodes hold their entries and the identifiers lie in text blocks, so
    // freeing is a walk of the blocks, not of the tree.
    for (node_block *b = tree->sat_blocks; b;) {
        node_block *next = b->next;
        std::free(b);
        b = next;
    }
    for (tree_text *t = tree->sat_texts; t;) {
        tree_text *next = t->next;
        std::free(t);
        t = next;
    }
    std::free(tree->sat_index);
    std::free(tree->sat_order);
    std::free(tree);
}

void free_acltrees(sec_acltree_t *trees, int count) {
    for (int i = count - 1; i >= 0; --i)
        sec__free_acltree(trees[i]);
    std::free(trees);
}

std::size_t tree_entry_count(sec_acltree_t tree) {
    std::size_t count = 0;
    if (tree)
        for (node_block *b = tree->sat_blocks; b; b = b->next)
            for (std::uint32_t i = 0; i < b->used; ++i)
                count += b->nodes()[i].sat_acle != nullptr;
    return count;
}

bool tree_has_entry(sec_acltree_t tree) {
    if (tree)
        for (node_block *b = tree->sat_blocks; b; b = b->next)
            for (std::uint32_t i = 0; i < b->used; ++i)
                if (b->nodes()[i].sat_acle)
                    return true;
    return false;
}

void sort_acltree(sec_acltree_t tree) {
    if (!tree->sat_order || tree->sat_sorted == tree->sat_count)
        return;
    // Identities in a tree are distinct, so no two nodes order equal.
    auto before = [](const ordered &a, const ordered &b) {
        if (a.key != b.key)
            return a.key < b.key;
        return order_ids(a.key, a.node->sat_entry.id, a.node->sat_id_size, b.key,
                         b.node->sat_entry.id, b.node->sat_id_size) < 0;
    };
    ordered *list = tree->sat_order, *sorted_end = list + tree->sat_sorted,
            *end = list + tree->sat_count;
    // A few nodes added to a sorted list, as an edit adds one, are put in
    // their places; many are sorted with the rest.
    if (end - sorted_end <= 8) {
        for (ordered *next = sorted_end; next != end; ++next)
            std::rotate(std::upper_bound(list, next, *next, before), next, next + 1);
    } else {
        std::sort(list, end, before);
    }
    tree->sat_sorted = tree->sat_count;
}

} // namespace kxacl
