// Entry trees: insertion with the duplicate rules, deletion, freeing.
#include "tree.h"

#include <algorithm>
#include <cstring>

#include <kx_cu.h>

#include "alloc.h"
#include "cu/posix_case.h"
#include "entries.h"
#include "frame.h"
#include "report.h"

namespace kxacl {

namespace {

namespace posix_case = kx::posix_case;
using node = sec_acltree_node_s;
using node_block = sec_acltree_block_s;
using tree_text = sec_acltree_text_s;

// Deeper than any balanced tree can grow: one of height 64 would need more
// than 10^13 nodes.
constexpr int max_height = 64;

// Nodes per block: the first block is small, for the many trees of one or a
// few entries that editing makes; each next one doubles, up to a size that
// keeps the block's waste small next to a large tree.
constexpr std::uint32_t first_block_nodes = 8;
constexpr std::uint32_t largest_block_nodes = 4096;
// Text blocks grow the same way, in bytes; a longer identifier gets a
// block of its own size.
constexpr std::size_t first_text_bytes = 256;
constexpr std::size_t largest_text_bytes = 65536;

int height(const node *n) {
    return n ? n->sat_height : 0;
}

void update_height(node *n) {
    n->sat_height = 1 + std::max(height(n->sat_left), height(n->sat_right));
}

node *rotate_right(node *y) {
    node *x = y->sat_left;
    y->sat_left = x->sat_right;
    x->sat_right = y;
    update_height(y);
    update_height(x);
    return x;
}

node *rotate_left(node *x) {
    node *y = x->sat_right;
    x->sat_right = y->sat_left;
    y->sat_left = x;
    update_height(x);
    update_height(y);
    return y;
}

node *rebalance(node *n) {
    update_height(n);
    int balance = height(n->sat_left) - height(n->sat_right);
    if (balance > 1) {
        if (height(n->sat_left->sat_left) < height(n->sat_left->sat_right))
            n->sat_left = rotate_left(n->sat_left);
        return rotate_right(n);
    }
    if (balance < -1) {
        if (height(n->sat_right->sat_right) < height(n->sat_right->sat_left))
            n->sat_right = rotate_right(n->sat_right);
        return rotate_left(n);
    }
    return n;
}

// The identity of an entry being looked up, measured once.
struct probe {
    const char *id;
    std::uint32_t size; // with the NUL; 0 without identifier
    std::uint64_t key;

    explicit probe(const sec_acle_t acle) {
        id = type_has_id(acle->type) ? (acle->id ? acle->id : "") : nullptr;
        size = id ? static_cast<std::uint32_t>(std::strlen(id) + 1) : 0;
        key = id ? posix_case::sort_key(id, size) : 0;
    }
};

// Orders the probe against a node that holds an identifier, as
// cu_strcasecmp_posix_1 orders their identifiers. Equal keys of a text that
// ends within them are equal texts; otherwise both go on past the key.
int order(const probe &p, const node *n) {
    if (p.key != n->sat_key)
        return p.key < n->sat_key ? -1 : 1;
    if (p.size <= 8)
        return 0;
    return posix_case::compare(p.id + 8, p.size - 8, n->sat_acle->id + 8, n->sat_id_size - 8);
}

// Where a walk down the tree for an identity ended.
enum class lookup { absent, found, unusable };
struct search {
    lookup outcome = lookup::absent;
    node **slot = nullptr; // the node found, or the empty slot for the identity
    node **path[max_height];
    int depth = 0; // slots passed above *slot, the root's first
};

// Walks down from the root to the node of the probe's identity, or to the
// empty slot where it belongs, noting the slots passed for rebalancing.
// Trees without identities hold one node, which is every entry's.
void find(sec_acltree_t tree, const probe &p, search *s) {
    s->slot = &tree->sat_root;
    if (!p.id) {
        s->outcome = *s->slot ? lookup::found : lookup::absent;
        return;
    }
    while (node *n = *s->slot) {
        // Deleted nodes carry no identity to steer by; callers write or free
        // a tree right after a deletion, so meeting one here is a misuse.
        if (!n->sat_acle || !n->sat_acle->id || s->depth == max_height) {
            s->outcome = lookup::unusable;
            return;
        }
        int c = order(p, n);
        if (c == 0) {
            s->outcome = lookup::found;
            return;
        }
        s->path[s->depth++] = s->slot;
        s->slot = c < 0 ? &n->sat_left : &n->sat_right;
    }
    s->outcome = lookup::absent;
}

// Restores the balance above a node just linked, from the lowest slot up;
// once a subtree has its old height again, nothing above it changes.
void rebalance_path(search &s) {
    for (int i = s.depth - 1; i >= 0; --i) {
        node *n = *s.path[i];
        int before = n->sat_height;
        n = rebalance(n);
        *s.path[i] = n;
        if (n->sat_height == before)
            break;
    }
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
    if (trace_level(TRC_INFO) != 0)
        trace_data(113, text(type_word(stored->type)),
                   text(type_has_mech(stored->type) ? stored->mech : "<none>"), text(stored->id));
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
    *n = node{nullptr, nullptr, nullptr, p.key, p.size, 1, sec_acle_desc{}};
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
    return !type_has_mech(acle->type) || cu_strcasecmp_posix_1(tree->sat_mech, acle->mech) == 0;
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
    probe p(acle);
    search s;
    find(*tree, p, &s);
    switch (s.outcome) {
    case lookup::found:
        if ((*s.slot)->sat_acle)
            return merge_duplicate(single, acle, *s.slot);
        [[fallthrough]];
    case lookup::unusable:
        return internal_error(here(src_acl), 0);
    case lookup::absent:
        break;
    }
    node *fresh = nullptr;
    kx_int32_t rc = make_node(*tree, acle, p, &fresh);
    if (rc != SEC_S_OK) {
        if (made_tree) {
            sec__free_acltree(*tree);
            *tree = nullptr;
        }
        return rc;
    }
    *s.slot = fresh;
    rebalance_path(s);
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
    search s;
    if (tree) {
        probe p(acle);
        find(tree, p, &s);
    }
    if (s.outcome != lookup::found || !(*s.slot)->sat_acle) {
        const char *mech = type_has_mech(acle->type) ? acle->mech : "";
        const char *id = type_has_id(acle->type) && acle->id ? acle->id : "";
        return report<MSG_2650_118>(SEC_S_ACLE_NOT_FOUND, acle->type, mech, id);
    }
    (*s.slot)->sat_acle = nullptr;
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

} // namespace kxacl
