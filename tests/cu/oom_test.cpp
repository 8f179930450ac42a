// Running out of memory. This program replaces malloc, calloc and realloc
// with versions that fail on request and otherwise pass to the C library;
// libkx_cu's calls resolve to them. Sanitizers bring their own allocator,
// so their builds skip these tests.
#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <cstring>
#include <string>

#include "cu_test_util.h"

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define CU_TEST_NO_MALLOC_HOOK 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer) ||                         \
    __has_feature(memory_sanitizer)
#define CU_TEST_NO_MALLOC_HOOK 1
#endif
#endif

namespace cu_test {
// Atomic with external linkage, so no compiler assumes calls leave it alone.
std::atomic<bool> fail_allocations{false};
} // namespace cu_test

#ifndef CU_TEST_NO_MALLOC_HOOK
extern "C" {
void *__libc_malloc(size_t);
void *__libc_calloc(size_t, size_t);
void *__libc_realloc(void *, size_t);

static bool refuse() {
    if (!cu_test::fail_allocations.load())
        return false;
    errno = ENOMEM;
    return true;
}

// Default visibility: the build hides symbols, and the dynamic linker must
// see these to prefer them to the C library's.
__attribute__((visibility("default"))) void *malloc(size_t n) {
    return refuse() ? nullptr : __libc_malloc(n);
}
__attribute__((visibility("default"))) void *calloc(size_t n, size_t size) {
    return refuse() ? nullptr : __libc_calloc(n, size);
}
__attribute__((visibility("default"))) void *realloc(void *p, size_t n) {
    return refuse() ? nullptr : __libc_realloc(p, n);
}
}
#endif

namespace {

using cu_test::current_error;

// Runs call with every allocation failing.
template <typename F> auto without_memory(F call) {
    cu_test::fail_allocations.store(true);
    auto result = call();
    cu_test::fail_allocations.store(false);
    return result;
}

class OutOfMemoryTest : public ::testing::Test {
  protected:
    void SetUp() override {
#ifdef CU_TEST_NO_MALLOC_HOOK
        GTEST_SKIP() << "allocation failures cannot be injected under a sanitizer";
#endif
    }
    void TearDown() override {
        cu_set_no_error_1();
    }
};

// The texts are larger than any record before them, so that the block that
// a cleared record leaves for the next one cannot hold them.
TEST_F(OutOfMemoryTest, StoringLeavesTheNoMemoryRecord) {
    static const std::string big(100000, 't');
    EXPECT_EQ(without_memory([] { return cu_set_error_1(4, "f", "c", 1, 2, "%1$s", big.c_str()); }),
              CU_ERROR_ID_NO_MEMORY);
    EXPECT_EQ(current_error()->cu_error_id, CU_ERROR_ID_NO_MEMORY);
    cu_set_no_error_1(); // must not free the static record
    EXPECT_EQ(current_error()->cu_error_id, 0);

    const cu_error_t mine = {9, nullptr, nullptr, 0, 0, const_cast<char *>(big.c_str()),
                             0, nullptr};
    EXPECT_EQ(without_memory([&] { return cu_pset_error_1(&mine); }), CU_ERROR_ID_NO_MEMORY);
    EXPECT_EQ(current_error()->cu_error_id, CU_ERROR_ID_NO_MEMORY);
}

// A cleared record's block holds the next record that fits, with no
// allocation at all.
TEST_F(OutOfMemoryTest, ClearedRecordHoldsTheNextOne) {
    ASSERT_EQ(cu_set_error_1(4, "f", "c", 1, 2, "%1$s", "a longer argument"), 0);
    cu_set_no_error_1();
    EXPECT_EQ(without_memory([] { return cu_set_error_1(5, "f", "c", 1, 3, "%1$s", "short"); }), 0);
    cu_test::ErrorPtr err = current_error();
    EXPECT_EQ(err->cu_error_id, 5);
    EXPECT_STREQ(err->cu_args[0].cu_arg_value.cu_arg_char_str, "short");
}

TEST_F(OutOfMemoryTest, GettersHandOutStaticResultsThatReleaseAccepts) {
    ASSERT_EQ(cu_set_error_1(4, nullptr, nullptr, 0, 0, "value %1$d", 1), 0);
    cu_test::ErrorPtr copy = current_error();
    auto get = [] {
        cu_error_t *err = nullptr;
        cu_get_error_1(&err);
        return err;
    };
    cu_test::ErrorPtr with_error(without_memory(get));
    cu_set_no_error_1();
    cu_test::ErrorPtr without_error(without_memory(get)); // no memory for the empty copy
    ASSERT_TRUE(with_error && without_error);
    EXPECT_EQ(with_error->cu_error_id, CU_ERROR_ID_NO_MEMORY);
    EXPECT_EQ(without_error->cu_error_id, CU_ERROR_ID_NO_MEMORY);

    char *text = nullptr;
    without_memory([&] {
        cu_get_errmsg_1(copy.get(), &text);
        return 0;
    });
    const cu_test::MessagePtr msg(text);
    ASSERT_NE(msg, nullptr);
    EXPECT_NE(std::strlen(msg.get()), 0u);
    EXPECT_EQ(std::strstr(msg.get(), "value"), nullptr);
}

} // namespace
