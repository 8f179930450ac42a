// Trace records read back from KX_TRACE_FILE: the line format, item bytes,
// whole lines from concurrent threads, and dropped or failed records. The
// file is opened once per process, so each case needs its own process (as
// ctest runs them).
#include <atomic>
#include <bit>
#include <cerrno>
#include <cstdint>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <functional>
#include <set>
#include <string>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <kx_tr.h>

#include "support.h"

namespace {

using kxtest::read_lines;
using kxtest::read_trace_lines;
// The item text of some bytes, computed independently of the library.
using kxtest::trace_item;
using strings = std::vector<std::string>;
// A length, typed as the C API reads it from the variadic arguments.
constexpr kx_uint32_t u32(kx_uint32_t n) {
    return n;
}

class Records : public ::testing::Test {
  protected:
    void SetUp() override { setenv("KX_TRACE_FILE", trace.c_str(), 1); }
    std::string trace = kxtest::temp_dir() + "/trace.out";
};

long long nanoseconds_of(long long seconds, long long nanoseconds) {
    return seconds * 1000000000 + nanoseconds;
}

// A new file gets mode 0644 whatever the umask.
TEST_F(Records, LinesCarryTimeThreadComponentIdAndHexItems) {
    timespec before{}, after{};
    clock_gettime(CLOCK_REALTIME, &before);
    const mode_t saved = umask(0);
    ASSERT_EQ(tr_record_id_1("_TST", 42), TR_OK);
    umask(saved);
    struct stat info {};
    ASSERT_EQ(stat(trace.c_str(), &info), 0);
    EXPECT_EQ(info.st_mode & 07777, 0644u);
    const kx_int32_t eight = 8;
    const unsigned char raw[] = {0x08, 0x00, 0xa0, 0xff};
    ASSERT_EQ(tr_record_data_1("_NOBODY", UINT32_MAX, 5, raw, u32(4), &eight, u32(4), "ab", u32(3),
                               raw, u32(0), nullptr, u32(5)),
              TR_OK);
    clock_gettime(CLOCK_REALTIME, &after);

    const auto r = read_trace_lines(trace);
    ASSERT_EQ(r.size(), 2u);
    EXPECT_EQ(std::tie(r[0].component, r[0].id, r[0].thread), std::tuple("_TST", 42u, gettid()));
    EXPECT_GE(nanoseconds_of(r[0].seconds, r[0].nanoseconds),
              nanoseconds_of(before.tv_sec, before.tv_nsec));
    EXPECT_LE(nanoseconds_of(r[1].seconds, r[1].nanoseconds),
              nanoseconds_of(after.tv_sec, after.tv_nsec));
    EXPECT_TRUE(r[0].items.empty());
    // _NOBODY need not be registered.
    EXPECT_EQ(std::tie(r[1].component, r[1].id), std::tuple("_NOBODY", 4294967295u));
    const char *eight_hex = std::endian::native == std::endian::little ? "08000000" : "00000008";
    EXPECT_EQ(r[1].items, (strings{"0800a0ff", eight_hex, "616200", "-", "-"}));
}

// Records append to what the file holds; refused ones write nothing, and
// no call changes errno.
TEST_F(Records, RecordsAppendInOrder) {
    std::ofstream(trace) << "earlier\n";
    errno = 4242;
    for (const char *bad : {static_cast<const char *>(nullptr), "", "a b", "a\tb", "a\nb"}) {
        EXPECT_EQ(tr_record_id_1(bad, 1), TR_BAD_ARGUMENT);
        EXPECT_EQ(tr_record_data_1(bad, 1, 1, "x", u32(1)), TR_BAD_ARGUMENT);
    }
    ASSERT_EQ(tr_record_id_1("_TST", 1), TR_OK);
    ASSERT_EQ(tr_record_data_1("_TST", 2, 1, "x", u32(1)), TR_OK);
    EXPECT_EQ(errno, 4242);
    const auto lines = read_lines(trace);
    ASSERT_EQ(lines.size(), 3u);
    EXPECT_EQ(lines[0], "earlier");
    EXPECT_TRUE(lines[1].ends_with(" _TST 1") && lines[2].ends_with(" _TST 2 78"));
}

// Every record from threads writing at once comes out as one whole line.
TEST_F(Records, ConcurrentRecordsStayWholeLines) {
    constexpr kx_uint32_t threads = 8, per_thread = 400;
    auto payload_of = [](kx_uint32_t t, kx_uint32_t seq) {
        std::vector<unsigned char> bytes((t * 131 + seq * 17) % 1500); // some beyond the stack
        for (std::size_t i = 0; i < bytes.size(); ++i)
            bytes[i] = static_cast<unsigned char>(t + seq + i);
        return bytes;
    };
    std::vector<long long> thread_ids(threads);
    std::atomic<int> failures{0};
    std::vector<std::thread> workers;
    for (kx_uint32_t t = 0; t < threads; ++t)
        workers.emplace_back([&, t] {
            thread_ids[t] = gettid();
            for (kx_uint32_t seq = 0; seq < per_thread; ++seq) {
                const auto p = payload_of(t, seq);
                failures += tr_record_data_1("_TST", t * per_thread + seq, 1, p.data(),
                                             static_cast<kx_uint32_t>(p.size())) != TR_OK;
            }
        });
    for (auto &w : workers)
        w.join();
    EXPECT_EQ(failures, 0);

    const auto records = read_trace_lines(trace);
    ASSERT_EQ(records.size(), threads * per_thread);
    std::set<unsigned long long> seen;
    for (const auto &r : records) {
        ASSERT_LT(r.id, threads * per_thread);
        const auto t = static_cast<kx_uint32_t>(r.id / per_thread);
        const auto p = payload_of(t, static_cast<kx_uint32_t>(r.id % per_thread));
        EXPECT_EQ(r.items, strings{trace_item(p.data(), p.size())});
        EXPECT_EQ(r.thread, thread_ids[t]);
        EXPECT_TRUE(seen.insert(r.id).second) << "twice: " << r.id;
    }
}

// Runs record in a child process, whose exit status it returns, or -1 when
// the child is ended by its alarm after 10 s.
int in_child(const std::function<int()> &record) {
    const pid_t child = fork();
    if (child == 0) {
        alarm(10);
        _exit(record());
    }
    int status = 0;
    return child > 0 && waitpid(child, &status, 0) == child && WIFEXITED(status)
               ? WEXITSTATUS(status)
               : -1;
}

// Without a file named, records are dropped, leaving no file, not even in
// the working directory; a file that cannot be opened or written fails
// every record, and opening a FIFO must not wait for a reader. No call
// changes errno. The file is opened once per process: one child per case.
TEST(Unrecorded, RecordsAreDroppedOrFailWithoutWaiting) {
    const std::string dir = kxtest::temp_dir(), work = kxtest::temp_dir(), fifo = dir + "/fifo";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    const std::string missing = dir + "/missing/trace.out";
    const struct {
        const char *file;
        int status;
    } cases[] = {{nullptr, TR_OK},
                 {"", TR_OK},
                 {missing.c_str(), TR_WRITE_FAILED},
                 {"/dev/full", TR_WRITE_FAILED},
                 {fifo.c_str(), TR_WRITE_FAILED}};
    for (const auto &c : cases) {
        if (c.file && access(c.file, F_OK) == 0 && access(c.file, W_OK) != 0)
            continue; // no writable /dev/full
        EXPECT_EQ(in_child([&] {
                      if (c.file)
                          setenv("KX_TRACE_FILE", c.file, 1);
                      else
                          unsetenv("KX_TRACE_FILE");
                      std::filesystem::current_path(work);
                      errno = 4242;
                      const int id = tr_record_id_1("_TST", 1);
                      const int data = tr_record_data_1("_TST", 2, 1, "x", u32(1));
                      return errno != 4242 ? 100 : id != data ? 101 : id;
                  }),
                  c.status)
            << (c.file ? c.file : "no KX_TRACE_FILE");
        EXPECT_TRUE(std::filesystem::is_empty(work));
    }
}

// Records count items of 16 bytes, the i-th at bytes + 16 * i.
template <std::size_t... I>
int record_16_byte_items(const unsigned char *bytes, kx_uint32_t count, std::index_sequence<I...>) {
    auto pairs =
        std::tuple_cat(std::make_tuple(static_cast<const void *>(bytes + 16 * I), u32(16))...);
    return std::apply([&](auto... pair) { return tr_record_data_1("_TST", 64, count, pair...); },
                      pairs);
}

// Item sizes across the point where a record outgrows the stack buffer,
// every byte value (i * 7 + 3 runs through all 256), and the most items a
// record takes.
TEST_F(Records, ItemsOfAnySizeAndCountAreWrittenWhole) {
    std::vector<unsigned char> bytes(6000);
    for (std::size_t i = 0; i < bytes.size(); ++i)
        bytes[i] = static_cast<unsigned char>(i * 7 + 3);
    std::vector<kx_uint32_t> lengths = {256, 6000};
    for (kx_uint32_t n = 440; n < 520; ++n)
        lengths.push_back(n);
    for (kx_uint32_t n : lengths)
        ASSERT_EQ(tr_record_data_1("_TST", n, 2, bytes.data(), n, "z", u32(2)), TR_OK);
    EXPECT_EQ(record_16_byte_items(bytes.data(), 64, std::make_index_sequence<64>()), TR_OK);
    EXPECT_EQ(record_16_byte_items(bytes.data(), 65, std::make_index_sequence<65>()),
              TR_BAD_ARGUMENT);
    EXPECT_EQ(tr_record_data_1("_TST", 1, UINT32_MAX), TR_BAD_ARGUMENT); // reads no argument

    const auto r = read_trace_lines(trace);
    ASSERT_EQ(r.size(), lengths.size() + 1);
    for (std::size_t i = 0; i < lengths.size(); ++i)
        EXPECT_EQ(r[i].items, (strings{trace_item(bytes.data(), lengths[i]), "7a00"}))
            << lengths[i];
    ASSERT_EQ(r.back().items.size(), 64u);
    for (std::size_t i = 0; i < 64; ++i)
        EXPECT_EQ(r.back().items[i], trace_item(&bytes[16 * i], 16)) << i;
}

} // namespace
