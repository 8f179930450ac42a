/* Writes the library's message table as a gencat source: set 1, one line per
 * message that has a text, so that gencat turns it into kxseclib.cat.
 *
 * gencat reads escapes only for the backslash and the line end in a way that
 * round-trips every byte: its octal escapes swallow any digits that follow,
 * so every other byte is written as it is. Bytes beyond ASCII would depend on
 * the locale gencat runs in, so the table must not hold any. */
#include <stdio.h>

#include <kx_acl.h>

/* Writes one text escaped for gencat; 0 when it holds a byte beyond ASCII. */
static int write_text(FILE *out, const char *text) {
    for (const unsigned char *p = (const unsigned char *)text; *p != '\0'; ++p) {
        if (*p > 0x7f)
            return 0;
        if (*p == '\\')
            fputs("\\\\", out);
        else if (*p == '\n')
            fputs("\\n", out);
        else if (*p == '\t')
            fputs("\\t", out);
        else
            fputc(*p, out);
    }
    return 1;
}

int main(int argc, char **argv) {
    if (argc != 2) {
        fprintf(stderr, "usage: %s output.msg\n", argv[0]);
        return 2;
    }
    FILE *out = fopen(argv[1], "w");
    if (out == NULL) {
        perror(argv[1]);
        return 1;
    }
    fputs("$ Generated from the library's message table; do not edit.\n$set 1\n", out);
    /* Message numbers start at 1: entry 0 is a reserved placeholder. */
    for (int number = 1; number < KXSECLIB_MSG_COUNT; ++number) {
        const char *text = cu_mesgtbl_kxseclib_msg[number];
        if (*text == '\0')
            continue;
        fprintf(out, "%d ", number);
        if (!write_text(out, text)) {
            fprintf(stderr, "message %d holds a byte beyond ASCII\n", number);
            fclose(out);
            return 1;
        }
        fputc('\n', out);
    }
    if (fclose(out) != 0) {
        perror(argv[1]);
        return 1;
    }
    return 0;
}
