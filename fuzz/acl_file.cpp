// Fuzz target: arbitrary text as an ACL file, read with sec_read_acl_file
// with the default and a custom template set, with and without the cache
// flags. The same text must compile to the same outcome every time; a
// compiled buffer must validate and answer every evaluation of its own
// entries with their masks; the cached file must hold exactly the compiled
// buffer and be read back as it; and no temporary file may stay behind.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "acl_exercise.h"

namespace {

using namespace kxfuzz;

std::string dir, acl_path, cacl_path;

// Templates unlike the default ones: a character used twice (the first
// wins), a template of two bits, the top bit, a byte above 0x7f.
sec_perm_desc custom_templates[] = {
    {0x00000001, 'R', "read", "first R"},       {0x00000100, 'R', "shadowed", "second R"},
    {0x00000006, 'm', "multi", "two bits"},     {0x80000000, 'z', "top", "bit 31"},
    {0x00000010, '\xe9', "latin", "0xe9"},      {0x00000020, 'r', "lower", "lower-case r"},
    {0x00000040, '#', "hash", "inside a token"}};
sec_perm_set_desc custom_set{7, custom_templates};

void remove_dir() {
    unlink(cacl_path.c_str());
    unlink(acl_path.c_str());
    rmdir(dir.c_str());
}

// The files live in memory (/dev/shm) unless TMPDIR says otherwise: a
// disk's renames and creations would make each input ten times slower.
void make_dir() {
    const char *tmp = std::getenv("TMPDIR");
    const char *base = tmp && *tmp ? tmp : access("/dev/shm", W_OK) == 0 ? "/dev/shm" : "/tmp";
    std::string pattern = std::string(base) + "/kxfuzz-acl-file-XXXXXX";
    expect(mkdtemp(pattern.data()) != nullptr, "mkdtemp");
    dir = pattern;
    acl_path = dir + "/acl";
    cacl_path = acl_path + ".cacl";
    std::atexit(remove_dir);
}

// The text as the ACL file, written well in the past, so that a cached
// file written now is newer; no cached file yet.
void write_acl_file(const std::uint8_t *data, std::size_t size) {
    unlink(cacl_path.c_str());
    int fd = open(acl_path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    expect(fd >= 0, "open the ACL file");
    expect(write(fd, data, size) == static_cast<ssize_t>(size), "write the ACL file");
    close(fd);
    timespec times[2] = {{1000000000, 0}, {1000000000, 0}};
    expect(utimensat(AT_FDCWD, acl_path.c_str(), times, 0) == 0, "date the ACL file");
}

std::vector<unsigned char> file_bytes(const std::string &path, bool *present) {
    std::vector<unsigned char> bytes;
    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    *present = fd >= 0;
    if (fd < 0)
        return bytes;
    unsigned char chunk[4096];
    for (ssize_t n; (n = read(fd, chunk, sizeof chunk)) > 0;)
        bytes.insert(bytes.end(), chunk, chunk + n);
    close(fd);
    return bytes;
}

void expect_only_acl_files() {
    DIR *d = opendir(dir.c_str());
    expect(d != nullptr, "opendir");
    while (dirent *e = readdir(d)) {
        std::string n = e->d_name;
        if (n != "." && n != ".." && n != "acl" && n != "acl.cacl")
            broken(("a file stayed behind: " + n).c_str());
    }
    closedir(d);
}

struct outcome {
    kx_int32_t status = 0;
    kx_int32_t msg = 0;
    kx_uint32_t rflags = 0;
    std::vector<unsigned char> bytes;
};

outcome read_acl(sec_perm_set_t templates, kx_uint32_t flags) {
    outcome o;
    owned_acl acl;
    acl.d.length = -1; // must be cleared whatever happens
    o.status =
        checked(sec_read_acl_file(acl_path.c_str(), nullptr, templates, flags, &acl.d, &o.rflags),
                "sec_read_acl_file");
    o.msg = o.status != SEC_S_OK ? current_record().msg : 0;
    o.bytes = acl.contents();
    expect(acl.d.length >= 0 && (acl.d.length == 0) == (acl.d.value == nullptr),
           "descriptor shape after a read", acl.d.length);
    expect(o.status == SEC_S_OK || acl.d.value == nullptr, "a failed read handed out bytes");
    return o;
}

// A compiled buffer is canonical: it validates, lists, and each entry's own
// identity evaluates to its mask (expanded ones only where a handler is).
void expect_canonical(const std::vector<unsigned char> &bytes) {
    owned_acl acl(bytes.data(), bytes.size());
    expect(bytes.empty() || validates(acl.d), "a compiled buffer does not validate");
    std::vector<listed> all = list_everything(&acl.d, true);
    std::size_t n = std::min(all.size(), entries_examined);
    for (std::size_t i = 0; i < n; ++i) {
        const listed &e = all[i];
        kx_uint32_t perm = 0;
        char *id = const_cast<char *>(e.id.c_str());
        kx_int32_t rc = SEC_S_OK;
        if (e.type == SEC_ACLE_GROUP) {
            sec_buffer_s group{static_cast<kx_int32_t>(e.id.size() + 1), id};
            rc = sec__group_acles_perm(&acl.d, 1, &group, &perm);
        } else if (e.type != SEC_ACLE_EXPANDED || e.mech == "unix") {
            rc = sec__single_acle_perm(&acl.d, e.type, const_cast<char *>(e.mech.c_str()), nullptr,
                                       id, &perm);
        } else {
            continue;
        }
        expect(rc == SEC_S_OK, "an entry of a compiled buffer is not found", rc);
        expect(perm == e.perm, "an entry of a compiled buffer evaluates to another mask", perm);
    }
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    prepare_process();
    make_dir();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    trace_levels_for(size);
    write_acl_file(data, size);
    constexpr kx_uint32_t text = SEC_F_ACL_TEXT, cache = SEC_F_ACL_CACHE,
                          convert = SEC_F_ACL_CONVERT, other_bit = 0x100;

    outcome compiled = read_acl(nullptr, text | other_bit);
    expect(compiled.rflags == (text | other_bit), "rflags of a compile", compiled.rflags);
    if (compiled.status == SEC_S_OK)
        expect_canonical(compiled.bytes);
    outcome custom = read_acl(&custom_set, text);
    if (custom.status == SEC_S_OK)
        expect_canonical(custom.bytes);

    // Compiling and caching: the same outcome, and the cached file holds it.
    outcome cached = read_acl(nullptr, cache);
    expect(cached.status == compiled.status && cached.msg == compiled.msg &&
               cached.bytes == compiled.bytes,
           "the same text compiled differently", cached.status);
    bool present = false;
    std::vector<unsigned char> cacl = file_bytes(cacl_path, &present);
    bool written = compiled.status == SEC_S_OK && !compiled.bytes.empty();
    expect(present == written, "a cached file where none belongs, or none where one does");
    expect(cacl == (written ? compiled.bytes : std::vector<unsigned char>{}),
           "the cached file differs from the compiled buffer");
    // A failed compile leaves 0x2 as it was; a successful one keeps it only
    // when the cached file was written.
    kx_uint32_t expected_rflags = size == 0                                ? cache
                                  : compiled.status != SEC_S_OK || written ? text | cache
                                                                           : text;
    expect(cached.rflags == expected_rflags, "rflags after caching", cached.rflags);

    // Reading it back, converted or not, with either template set.
    if (written) {
        outcome back = read_acl(nullptr, cache | convert);
        expect(back.status == SEC_S_OK && back.bytes == compiled.bytes && back.rflags == convert,
               "the cached file was not read back as written", back.rflags);
        outcome other = read_acl(&custom_set, 0);
        expect(other.status == SEC_S_OK && other.bytes == compiled.bytes && other.rflags == 0,
               "the cached file was not read back with other templates", other.rflags);
    }
    expect_only_acl_files();
    return 0;
}
