// Texts read through a window of whole lines; names flipped between steps.
#include <algorithm>
#include <cerrno>
#include <sys/wait.h>
#include <tuple>

#include "file_helpers.h"
#include "parse.h"

using namespace kxacl;
using namespace kxtest;
using namespace std::string_literals;

namespace {

using compiled_text = std::tuple<kx_int32_t, std::string, std::string>;

// The reference: the text compiled in memory.
compiled_text compile_in_memory(std::string text) {
    text.push_back('\0');
    char *cursor = text.data();
    std::size_t remaining = text.size();
    int lineno = 1;
    owned_trees trees;
    owned_acl acl;
    kx_int32_t rc;
    sec_acle_desc entry{};
    while ((rc = sec__read_acle_from_text(nullptr, &cursor, &remaining, &lineno, &entry)) == 1)
        if (entry.type != 0 &&
            (rc = sec__add_acle_to_trees(&entry, &trees.trees, &trees.count)) != SEC_S_OK)
            break;
    if (rc == 0 && trees.count > 0)
        rc = sec__acltrees_to_acl(trees.trees, trees.count, acl.get());
    bytes b = acl.contents();
    return {rc, rc == 0 ? "" : last_error().text, std::string(b.begin(), b.end())};
}
compiled_text compile_file(const std::string &text) {
    acl_dir d(text);
    acl_read r(d.acl, TEXT);
    return {r.status, r.status == 0 ? "" : last_error().text, r.bytes()};
}

// Comment lines of n bytes in all (n >= 2).
std::string padding(std::size_t n) {
    std::string pad;
    while (n - pad.size() > 1000)
        pad += "#" + std::string(998, 'p') + "\n";
    return pad + "#" + std::string(n - pad.size() - 2, 'p') + "\n";
}
std::string users(int n) {
    std::string text;
    for (int i = 0; i < n; ++i)
        text += "u unix user" + std::to_string(i) + "@h rw\n";
    return text;
}
constexpr std::size_t window = 64 * 1024;

TEST(ReadAclFileText, AnyTextReadsAsItCompilesInMemory) {
    const std::string long_line =
        std::string(1, '#').append(1094, 'x').append(1, '\n'); // 1096 bytes
    const std::string texts[] = {
        "o r\nu unix bob rw", // the last line has no line end
        users(4000) + "g last r",
        padding(window - 500) + long_line + "g staff r\n",
        padding(window - 500) + "#x" + long_line + "g staff r\n", // 1097 bytes: 2650-158
        std::string(70000, 'a') + "\n",                           // one line fills the window
        padding(window + 10) + "\0o r\n\0"s,                      // a NUL ends the text
        padding(window - 2) + "o r\0x\n"s + users(10),            // inside a line: 2650-144
        padding(window + 3) + "o r\0"s,                           // NUL as the last byte
        std::string(window - 1, '\r') + "\n\nn r\r\ng staff r",   // line ends of every kind
        std::string(200000, '\n'),                                // nothing but line ends
        std::string(window, ' ') + "o r\n",                       // blanks: a long line
    };
    for (const std::string &text : texts) {
        SCOPED_TRACE(std::to_string(text.size()) + " bytes ending " +
                     text.substr(text.size() - std::min<std::size_t>(text.size(), 20)));
        EXPECT_EQ(compile_file(text), compile_in_memory(text));
    }
    EXPECT_NE(std::get<2>(compile_file(texts[1])), std::get<2>(compile_file(users(4000))));
}

// "mine", root's, and "theirs", daemon's, of other modes; "acl" starts as "mine".
struct two_owners {
    acl_dir d{"o r\n", 0644};
    std::string mine = d.dir + "/mine", theirs = d.dir + "/theirs";
    std::string compiled_mine = compiled("o r\n"),
                compiled_theirs = compiled("o rwcx\ng staff r\n");
    two_owners() {
        EXPECT_EQ(link(d.acl.c_str(), mine.c_str()), 0);
        write_file(theirs, "o rwcx\ng staff r\n", 0600);
        EXPECT_EQ(chown(theirs.c_str(), 1, 1), 0);
        shift_mtime(theirs, -20);
    }
    void swap_in(const std::string &what) const {
        std::string staged = d.dir + "/staged";
        int made = what == "mine"     ? link(mine.c_str(), staged.c_str())
                   : what == "theirs" ? link(theirs.c_str(), staged.c_str())
                                      : symlink("/dev/null", staged.c_str());
        ASSERT_EQ(made, 0) << what;
        ASSERT_EQ(rename(staged.c_str(), d.acl.c_str()), 0);
    }
    // A CACL file left holds the bytes of the file whose owner and mode it carries.
    void expect_honest_cacl() const {
        if (read_file(d.cacl) == "<missing>")
            return;
        struct stat st = status_of(d.cacl);
        bool root = st.st_uid == 0;
        EXPECT_EQ(read_file(d.cacl), root ? compiled_mine : compiled_theirs);
        EXPECT_TRUE(st.st_uid == st.st_gid && st.st_uid <= 1);
        EXPECT_EQ(st.st_mode & 07777, root ? 0644u : 0600u);
    }
};

struct swap_step {
    sys_call call;
    long nth;
    const char *swapped;
};

TEST(ReadAclFileRaces, NameGivenToAnotherFileBetweenTheReadersSteps) {
    KXTEST_REQUIRE_ROOT();
    enum class ends { mine, theirs, refused, given_up };
    // open 0 is the CACL file's (absent), open 1 the text's; lstat 0 the
    // writer's first look at the CACL name, stat 1 its last look at the ACL
    // file's name, before the rename.
    const swap_step before_open = {sys_call::open, 1, "theirs"};
    struct {
        const char *what;
        std::vector<swap_step> swaps;
        ends result;
        bool cached;
    } cases[] = {
        // clang-format off
        {"before the open", {before_open}, ends::theirs, true},
        {"device before the open", {{sys_call::open, 1, "device"}}, ends::refused, false},
        {"after the compile", {{sys_call::lstat, 0, "theirs"}}, ends::mine, false},
        {"before the last look", {{sys_call::stat, 1, "theirs"}}, ends::mine, false},
        {"at the rename", {{sys_call::rename, 0, "theirs"}}, ends::mine, true},
        // The forged cache: theirs compiled, the name back at mine while writing.
        {"flipped for the open and back", {before_open, {sys_call::lstat, 0, "mine"}}, ends::theirs, false},
        {"flipped for the open and back at the rename", {before_open, {sys_call::rename, 0, "mine"}},
         ends::theirs, true},
        // Each of the three openings finds another file than its status.
        {"flipped before every open", {before_open, {sys_call::open, 0, "mine"},
         {sys_call::open, 0, "theirs"}}, ends::given_up, false},
        // clang-format on
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        two_owners files;
        std::size_t next = 0;
        std::function<void()> swap = [&] {
            files.swap_in(c.swaps[next++].swapped);
            if (next < c.swaps.size())
                flip_before(c.swaps[next].call, c.swaps[next].nth, &swap);
        };
        flip_before(c.swaps[0].call, c.swaps[0].nth, &swap);
        acl_read r(files.d.acl, CACHE);
        EXPECT_EQ(next, c.swaps.size());
        sys_fail_nth(sys_call::open, -1, 0);
        if (c.result == ends::refused) {
            EXPECT_EQ(r.status, SEC_S_NO_ACL_FILE);
            EXPECT_EQ(last_error().msg_num, MSG_2650_135);
        } else if (c.result == ends::given_up) {
            EXPECT_EQ(r.status, SEC_S_FILE_ERROR);
            EXPECT_TRUE(record_is(SEC_S_FILE_ERROR, MSG_2650_139, {0, 4, 0})); // mine, as seen
        } else {
            ASSERT_EQ(r.status, SEC_S_OK) << last_error().text;
            EXPECT_EQ(r.bytes(),
                      c.result == ends::mine ? files.compiled_mine : files.compiled_theirs);
            EXPECT_EQ(r.rflags, c.cached ? TEXT | CACHE : TEXT);
        }
        EXPECT_EQ(r.status == SEC_S_OK, !r.empty());
        EXPECT_EQ(read_file(files.d.cacl) != "<missing>", c.cached);
        files.expect_honest_cacl();
        for (const auto &n : dir_entries(files.d.dir))
            EXPECT_TRUE(n == "acl" || n == "acl.cacl" || n == "mine" || n == "theirs") << n;
    }
}

// A daemon without a controlling terminal opens a terminal swapped in for
// its ACL file without acquiring it, and refuses it.
TEST(ReadAclFileRaces, TerminalSwappedInIsNeitherAcquiredNorRead) {
    acl_dir d;
    pid_t pid = fork();
    if (pid == 0) {
        int master = posix_openpt(O_RDWR | O_NOCTTY);
        std::string staged = d.dir + "/tty";
        if (setsid() < 0 || master < 0 || grantpt(master) != 0 || unlockpt(master) != 0 ||
            symlink(ptsname(master), staged.c_str()) != 0)
            _exit(10);
        std::function<void()> swap = [&] { rename(staged.c_str(), d.acl.c_str()); };
        flip_before(sys_call::open, 0, &swap);
        acl_read r(d.acl, TEXT);
        if (!sys_fault_fired() || r.status != SEC_S_NO_ACL_FILE)
            _exit(12);
        // Without a controlling terminal, there is none to open.
        _exit(open("/dev/tty", O_RDONLY | O_NOCTTY) < 0 ? 0 : 13);
    }
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0);
}

} // namespace
