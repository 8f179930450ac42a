// Entry trees: insertion with the duplicate rules, deletion, freeing.
#include "tree.h"

#include <algorithm>
#include <cstring>

#include <kx_cu.h>

#include "alloc.h"
#include "entries.h"
#include "frame.h"
#include "report.h"

namespace kxacl {

namespace {

using node = sec_acltree_node_s;

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

// Links a fresh node whose identity is not in the subtree; the depth of the
// recursion is the height of a balanced tree.
node *link_node(node *n, node *fresh) {
    if (!n)
        return fresh;
    if (cu_strcasecmp_posix_1(fresh->sat_acle->id, n->sat_acle->id) < 0)
        n->sat_left = link_node(n->sat_left, fresh);
    else
        n->sat_right = link_node(n->sat_right, fresh);
    return rebalance(n);
}

// Outcome of looking an identity up.
enum class lookup { absent, found, unusable };

// Finds the node of acle's identity: the single node of an unauthenticated or
// anyother tree, else the node whose identifier equals acle's ignoring case.
lookup find_node(sec_acltree_t tree, const sec_acle_t acle, node **found) {
    *found = nullptr;
    if (!tree || !tree->sat_root)
        return lookup::absent;
    if (!type_has_id(acle->type)) {
        *found = tree->sat_root;
        return lookup::found;
    }
    const char *id = acle->id ? acle->id : "";
    for (node *n = tree->sat_root; n;) {
        // Deleted nodes carry no identity to steer by; callers write or free
        // a tree right after a deletion, so meeting one here is a misuse.
        if (!n->sat_acle || !n->sat_acle->id)
            return lookup::unusable;
        int c = cu_strcasecmp_posix_1(id, n->sat_acle->id);
        if (c == 0) {
            *found = n;
            return lookup::found;
        }
        n = c < 0 ? n->sat_left : n->sat_right;
    }
    return lookup::absent;
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

// A node holding a deep copy of acle.
kx_int32_t make_node(const sec_acle_t acle, node **out) {
    unique_mem<node> fresh(static_cast<node *>(mem_zalloc(sizeof(node))));
    if (!fresh)
        return no_memory("sec__add_acle_to_tree", sizeof(node));
    unique_acle copy(static_cast<sec_acle_t>(mem_zalloc(sizeof(sec_acle_desc))));
    if (!copy)
        return no_memory("sec__add_acle_to_tree", sizeof(sec_acle_desc));
    copy->perm = acle->perm;
    copy->type = acle->type;
    if (type_has_mech(acle->type))
        std::memcpy(copy->mech, acle->mech, SEC_MECH_MAX);
    if (type_has_id(acle->type) && acle->id) {
        std::size_t length = std::strlen(acle->id);
        copy->id = mem_strndup(acle->id, length);
        if (!copy->id)
            return no_memory("sec__add_acle_to_tree", length + 1);
    }
    fresh->sat_acle = copy.release();
    fresh->sat_height = 1;
    *out = fresh.release();
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
    node *existing = nullptr;
    switch (find_node(*tree, acle, &existing)) {
    case lookup::found:
        return merge_duplicate(single, acle, existing);
    case lookup::unusable:
        return internal_error(here(src_acl), 0);
    case lookup::absent:
        break;
    }
    bool made_tree = false;
    if (!*tree) {
        kx_int32_t rc = make_tree(acle, tree);
        if (rc != SEC_S_OK)
            return rc;
        made_tree = true;
    }
    node *fresh = nullptr;
    kx_int32_t rc = make_node(acle, &fresh);
    if (rc != SEC_S_OK) {
        if (made_tree) {
            std::free(*tree);
            *tree = nullptr;
        }
        return rc;
    }
    sec_acltree_t t = *tree;
    t->sat_root = link_node(t->sat_root, fresh);
    if (t->sat_last)
        t->sat_last->sat_next = fresh;
    else
        t->sat_first = fresh;
    t->sat_last = fresh;
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
    if (find_node(tree, acle, &found) != lookup::found || !found->sat_acle) {
        const char *mech = type_has_mech(acle->type) ? acle->mech : "";
        const char *id = type_has_id(acle->type) && acle->id ? acle->id : "";
        return report<MSG_2650_118>(SEC_S_ACLE_NOT_FOUND, acle->type, mech, id);
    }
    release_acle(found->sat_acle);
    found->sat_acle = nullptr;
    return SEC_S_OK;
}

void sec__free_acltree(sec_acltree_t tree) {
    if (!tree)
        return;
    // Every node is on the insertion list, so freeing needs no recursion.
    for (node *n = tree->sat_first; n;) {
        node *next = n->sat_next;
        release_acle(n->sat_acle);
        std::free(n);
        n = next;
    }
    std::free(tree);
}

void free_acltrees(sec_acltree_t *trees, int count) {
    for (int i = count - 1; i >= 0; --i)
        sec__free_acltree(trees[i]);
    std::free(trees);
}

bool tree_has_entry(sec_acltree_t tree) {
    if (tree)
        for (node *n = tree->sat_first; n; n = n->sat_next)
            if (n->sat_acle)
                return true;
    return false;
}

std::size_t tree_entry_count(sec_acltree_t tree) {
    std::size_t count = 0;
    if (tree)
        for (node *n = tree->sat_first; n; n = n->sat_next)
            count += n->sat_acle != nullptr;
    return count;
}

} // namespace kxacl
