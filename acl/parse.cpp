// The ACL text format: one entry per line, tokens separated by blanks,
// comments from a '#' where a token would start. The parser works in place
// on the caller's text and allocates nothing, so an entry it fills points
// into that text.
#include "parse.h"

#include <cctype>
#include <cstring>

#include <kx_cu.h>

#include "entries.h"
#include "frame.h"
#include "perms.h"
#include "report.h"

namespace kxacl {

namespace {

// Skipped before a token. FF and CR are not: they end the line.
bool is_blank(char c) {
    return c == ' ' || c == '\t' || c == '\v';
}

// One line of the text, found within the remaining length.
struct text_line {
    char *start;
    char *end;       // the character that ends the line
    bool last;       // ended by a NUL: nothing of the text follows it
    bool terminated; // the end character lies within the remaining length

    // Bytes from the start up to and including the end character.
    std::size_t size() const { return static_cast<std::size_t>(end - start) + 1; }
    char *next() const { return end + 1; }
};

// The line at start. A remaining length without any line end in it breaks
// the caller's promise that a NUL ends the text; the line is then taken as
// ending right after the bytes we may read, and is never tokenised.
text_line find_line(char *start, std::size_t remaining) {
    for (std::size_t i = 0; i < remaining; ++i) {
        if (ends_line(start[i]))
            return {start, start + i, start[i] == '\0', true};
    }
    return {start, start + remaining, true, false};
}

// The tokens of one line, each cut out of the text by writing a NUL over
// the byte that ends it.
class line_tokens {
  public:
    line_tokens(const text_line &line, const space_bytes &spaces)
        : pos_(line.start), end_(line.end), spaces_(spaces) {}

    // The next token, or null when only blanks and perhaps a comment remain.
    // A token may be empty when a locale white-space byte that is not a
    // blank stands where it would start.
    char *next() {
        while (pos_ < end_ && is_blank(*pos_))
            ++pos_;
        if (pos_ == end_ || *pos_ == '#')
            return nullptr;
        char *token = pos_;
        while (pos_ < end_ && !spaces_(*pos_))
            ++pos_;
        // The line's end character may be overwritten too: it has been found.
        bool line_goes_on = pos_ < end_;
        *pos_ = '\0';
        if (line_goes_on)
            ++pos_;
        return token;
    }

  private:
    char *pos_;
    char *end_;
    const space_bytes &spaces_;
};

// The type code of a type token, 0 when it is not one.
unsigned char type_of_token(const char *token) {
    if (token[0] == '\0' || token[1] != '\0')
        return 0;
    switch (token[0]) {
    case 'n':
    case 'N':
        return SEC_ACLE_UNAUTHENTICATED;
    case 'o':
    case 'O':
        return SEC_ACLE_ANYOTHER;
    case 'u':
    case 'U':
        return SEC_ACLE_USER;
    case 'e':
    case 'E':
        return SEC_ACLE_EXPANDED;
    case 'g':
    case 'G':
        return SEC_ACLE_GROUP;
    default:
        return 0;
    }
}

// A mechanism or identity token that the type needs. An empty one (see
// line_tokens::next) counts as missing: an entry never gets an empty
// mechanism or identity.
kx_int32_t required_token(line_tokens &tokens, int lineno, char **token) {
    *token = tokens.next();
    if (!*token || **token == '\0')
        return report<MSG_2650_172>(SEC_S_BAD_ACL, lineno);
    return SEC_S_OK;
}

kx_int32_t take_mechanism(line_tokens &tokens, int lineno, sec_acle_t acle) {
    char *mech = nullptr;
    kx_int32_t rc = required_token(tokens, lineno, &mech);
    if (rc != SEC_S_OK)
        return rc;
    std::size_t length = std::strlen(mech);
    if (length > SEC_MECH_MAX)
        return report<MSG_2650_145>(SEC_S_BAD_ACL, mech, lineno);
    for (char *c = mech; *c; ++c)
        *c = static_cast<char>(cu_tolower_posix_1(static_cast<unsigned char>(*c)));
    std::memcpy(acle->mech, mech, length + 1);
    return SEC_S_OK;
}

kx_int32_t take_permissions(const char *perms, sec_perm_set_t permset, int lineno,
                            sec_acle_t acle) {
    kx_int32_t rc = sec__translate_perms(perms, perm_set_or_default(permset), &acle->perm);
    if (rc == SEC_S_OK)
        return rc;
    // The line number and the whole token tell the reader more than the
    // translator's single character does.
    cu_set_no_error_1();
    return report<MSG_2650_180>(rc, lineno, perms);
}

// Fills acle from the tokens of one line; a line without tokens leaves it
// all zero.
kx_int32_t parse_entry(line_tokens &tokens, sec_perm_set_t permset, int lineno, sec_acle_t acle) {
    char *type = tokens.next();
    if (!type)
        return SEC_S_OK;
    acle->type = type_of_token(type);
    if (acle->type == 0)
        return report<MSG_2650_179>(SEC_S_BAD_ACL, lineno, type);
    kx_int32_t rc = SEC_S_OK;
    if (type_has_mech(acle->type))
        rc = take_mechanism(tokens, lineno, acle);
    if (rc == SEC_S_OK && type_has_id(acle->type))
        rc = required_token(tokens, lineno, &acle->id);
    if (rc != SEC_S_OK)
        return rc;
    char *perms = tokens.next();
    if (!perms)
        return SEC_S_OK;
    rc = take_permissions(perms, permset, lineno, acle);
    if (rc == SEC_S_OK && tokens.next())
        rc = report<MSG_2650_173>(SEC_S_BAD_ACL, lineno);
    return rc;
}

kx_int32_t line_too_long(int lineno, std::size_t size) {
    ensure_trace_registered();
    if (wanted<KX_ACL_TP_PARSE_LINE_TOO_LONG>()) {
        kx_int32_t traced_size = byte_count(size);
        trace<KX_ACL_TP_PARSE_LINE_TOO_LONG>(num(lineno), num(traced_size));
    }
    return report<MSG_2650_158>(SEC_S_FILE_ERROR, lineno);
}

// What one line came to: a status, and whether the cursor stays at the line.
struct line_outcome {
    kx_int32_t status;
    bool cursor_stays;
};

// 2650-144: a NUL byte stands inside the text, or the text does not end
// where its length says. The cursor stays at the line's start.
line_outcome corrupt_line(int lineno) {
    return {report<MSG_2650_144>(SEC_S_BAD_ACL, lineno), true};
}

line_outcome parse_line(const space_bytes &spaces, const text_line &line, std::size_t remaining,
                        sec_perm_set_t permset, int lineno, sec_acle_t acle) {
    if (line.size() > max_line_length)
        return {line_too_long(lineno, line.size()), false};
    if (!line.terminated)
        return corrupt_line(lineno);
    line_tokens tokens(line, spaces);
    kx_int32_t rc = parse_entry(tokens, permset, lineno, acle);
    if (rc != SEC_S_OK)
        return {rc, false};
    // The NUL that ends the last line must be the text's own.
    if (line.last && line.size() != remaining)
        return corrupt_line(lineno);
    return {SEC_S_OK, false};
}

} // namespace

space_bytes::space_bytes() {
    for (int c = 0; c < 256; ++c)
        space_[c] = std::isspace(c) != 0;
}

kx_int32_t sec__read_acle_from_text(sec_perm_set_t permset, char **tacl, std::size_t *length,
                                    int *lineno, sec_acle_t acle) {
    return read_acle_from_text(space_bytes(), permset, tacl, length, lineno, acle);
}

kx_int32_t read_acle_from_text(const space_bytes &spaces, sec_perm_set_t permset, char **tacl,
                               std::size_t *length, int *lineno, sec_acle_t acle) {
    std::memset(acle, 0, sizeof *acle);
    char *start = *tacl;
    // A length of 0 leaves not even the terminating NUL to look at.
    if (!start || *length == 0 || *start == '\0')
        return 0;
    text_line line = find_line(start, *length);
    line_outcome outcome = parse_line(spaces, line, *length, permset, *lineno, acle);
    ++*lineno;
    if (outcome.status != SEC_S_OK) {
        if (!outcome.cursor_stays)
            *tacl = line.last ? nullptr : line.next();
        return outcome.status;
    }
    if (line.last) {
        *tacl = nullptr;
    } else {
        *length -= line.size();
        *tacl = line.next();
    }
    return 1;
}

} // namespace kxacl
