// Listing and editing: adding and deleting one entry in a sub-ACL of 10 000
// user entries, and listing an ACL of 100 000 entries. Listing runs beside
// the least that it must do: one block per entry for the caller, filled
// with the entry and its identity, and released again.
#include <cstring>

#include "support.h"

namespace kxbench {
namespace {

// ---- adding and deleting ---------------------------------------------------

struct edited_acl {
    std::vector<std::string> ids = sorted_identities(10000);
    owned_acl acl;
    sec_acle_t added = nullptr;

    edited_acl() {
        std::string path = scratch_dir() + "/edited.10000";
        write_acl_file(path, user_lines(ids, "u krb5"));
        compile_acl_file(path, &acl.buf);
        // Sorts into the middle of the entries.
        std::string id = ids[ids.size() / 2] + "x";
        if (sec_create_acle(SEC_ACLE_USER, 0x1, "krb5", id.c_str(), &added) != SEC_S_OK)
            fail("cannot create the added entry");
    }
    ~edited_acl() { sec_release_acle(added); }
};

edited_acl &edited() {
    static edited_acl e;
    return e;
}

// Adds the entry and deletes it again, so that every iteration starts from
// the same ACL; only the one operation measured is timed.
enum class timed { add, del };

void add_and_delete(benchmark::State &state, timed which) {
    edited_acl &e = edited();
    for (auto _ : state) {
        if (which == timed::del)
            state.PauseTiming();
        if (sec_add_acle_to_acl2(e.added, &e.acl.buf) != SEC_S_OK)
            state.SkipWithError("adding failed");
        if (which == timed::del)
            state.ResumeTiming();
        else
            state.PauseTiming();
        if (sec_del_acle_from_acl(e.added, &e.acl.buf) != SEC_S_OK)
            state.SkipWithError("deleting failed");
        if (which == timed::add)
            state.ResumeTiming();
    }
}

// ---- listing ---------------------------------------------------------------

struct listed_acl {
    std::vector<std::string> ids = sorted_identities(100000);
    owned_acl acl;
    listed_acl() {
        std::string path = scratch_dir() + "/listed.100000";
        write_acl_file(path, user_lines(ids));
        compile_acl_file(path, &acl.buf);
    }
};

listed_acl &listed() {
    static listed_acl l;
    return l;
}

void list_acl(benchmark::State &state) {
    listed_acl &l = listed();
    for (auto _ : state) {
        sec_acle_list_desc list{0, nullptr};
        if (sec_list_acl(&l.acl.buf, &list) != SEC_S_OK ||
            list.count != static_cast<kx_int32_t>(l.ids.size()))
            state.SkipWithError("listing failed");
        sec_release_aclelist(&list);
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * l.ids.size()));
}

void list_acl_baseline(benchmark::State &state) {
    listed_acl &l = listed();
    for (auto _ : state) {
        std::size_t n = l.ids.size();
        auto **entries = static_cast<sec_acle_t *>(std::malloc(n * sizeof(sec_acle_t)));
        for (std::size_t i = 0; i < n; ++i) {
            const std::string &id = l.ids[i];
            auto *e = static_cast<sec_acle_t>(std::malloc(sizeof(sec_acle_desc) + id.size() + 1));
            e->perm = 0x3;
            e->type = SEC_ACLE_USER;
            std::memcpy(e->mech, "unix", 5);
            e->id = reinterpret_cast<char *>(e + 1);
            std::memcpy(e->id, id.c_str(), id.size() + 1);
            entries[i] = e;
        }
        benchmark::DoNotOptimize(entries);
        for (std::size_t i = 0; i < n; ++i)
            std::free(entries[i]);
        std::free(entries);
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * l.ids.size()));
}

bool registered = [] {
    benchmark::RegisterBenchmark("add_acle_to_acl/entries:10000", add_and_delete, timed::add)
        ->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("del_acle_from_acl/entries:10000", add_and_delete, timed::del)
        ->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("list_acl/entries:100000", list_acl)
        ->Unit(benchmark::kMillisecond);
    benchmark::RegisterBenchmark("list_acl.baseline/entries:100000", list_acl_baseline)
        ->Unit(benchmark::kMillisecond);
    return true;
}();

} // namespace
} // namespace kxbench
