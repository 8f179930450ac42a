// Printing an ACL buffer for diagnosis, one catalogue message per line.
#ifndef KXACL_DUMP_H
#define KXACL_DUMP_H

#include <cstdio>

#include <kx_acl.h>

#include "buffer_format.h"
#include "tree.h"

namespace kxacl {

// Where a dump goes: its lines, and the structural failures of the buffer
// that stop it. Each call appends one piece of text; a reader of both
// channels sees the pieces in the order of the calls.
class dump_sink {
  public:
    virtual void line(const char *text) noexcept = 0;
    virtual void failure(const char *text) noexcept = 0;

  protected:
    ~dump_sink() = default;
};

// A sink of two streams, flushed after every piece so that the lines and
// the failures interleave as they were written. A null stream drops its
// channel.
class stream_sink final : public dump_sink {
  public:
    stream_sink(std::FILE *lines, std::FILE *failures) : lines_(lines), failures_(failures) {}
    void line(const char *text) noexcept override { put(lines_, text); }
    void failure(const char *text) noexcept override { put(failures_, text); }

  private:
    static void put(std::FILE *stream, const char *text) noexcept;
    std::FILE *lines_, *failures_;
};

// Dumps the ACL buffer acl into sink: its descriptor, then each sub-ACL.
void dump_acl(sec_acl_buffer_t acl, dump_sink &sink) noexcept;

// Dumps the header line of the sub-ACL v of b and then its entries, each
// line preceded by leadspace (the entries by leadspace and a tab). A
// sub-ACL whose entries cannot be read gives a failure.
void sec__dump_subacl(acl_bytes b, const subacl_view &v, const char *leadspace, dump_sink &sink);

// Dumps the entries of tree in the order of its sub-ACL.
void sec__dump_acltree(sec_acltree_t tree, const char *leadspace, dump_sink &sink);

// Dumps one entry's line with ptplset (the default templates when null),
// or, as a line, the failure that stops it from being displayed. A null
// entry dumps nothing. Without a sink the line goes to standard error.
void sec__dump_acle(sec_acle_t acle, sec_perm_set_t ptplset, const char *leadspace,
                    dump_sink &sink);
void sec__dump_acle(sec_acle_t acle, sec_perm_set_t ptplset, const char *leadspace);

} // namespace kxacl

#endif
