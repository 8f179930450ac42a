#!/usr/bin/env python3
"""Writes the seed corpora of the fuzz targets into fuzz/corpus/<target>/.

Run by hand after changing the seeds; its output is kept in the repository.
The buffers follow the layout described in acl/buffer_format.h.
"""
import os
import shutil
import struct

HERE = os.path.dirname(os.path.abspath(__file__))


def entry(perm, ident=None, version=1):
    data = b"" if ident is None else ident + b"\0"
    return struct.pack("<BIH", version, perm, len(data)) + data


def subacl(type_, entries, mech=None, extra=0):
    m = b"" if mech is None else mech + b"\0"
    body = b"".join(entries)
    length = 10 + len(m) + len(body) + extra
    return struct.pack("<IBIB", length, type_, len(entries), len(m)) + m + body


def acl(subacls, mark=2):
    return struct.pack("<BBBH", 0x85, 1, mark, len(subacls)) + b"".join(subacls)


def posix_key(ident):
    return ident.lower()  # bytes.lower folds A to Z only, as the POSIX locale does


def sorted_entries(pairs):
    return [entry(p, i) for i, p in sorted(pairs, key=lambda e: posix_key(e[0]))]


def other_order(buf):
    """The host-order buffer buf as a host of the other byte order writes it."""
    b = bytearray(buf)
    count = struct.unpack_from("<H", b, 3)[0]
    struct.pack_into(">H", b, 3, count)
    at = 5
    for _ in range(count):
        length, _, entries, mech_length = struct.unpack_from("<IBIB", b, at)
        struct.pack_into(">I", b, at, length)
        struct.pack_into(">I", b, at + 5, entries)
        record = at + 10 + mech_length
        for _ in range(entries):
            perm, id_length = struct.unpack_from("<IH", b, record + 1)
            struct.pack_into(">IH", b, record + 1, perm, id_length)
            record += 7 + id_length
        at += length
    b[2] = 1
    return bytes(b)


WORKED = acl([subacl(2, [entry(1)]), subacl(16, [entry(1, b"staff")]),
              subacl(4, [entry(3, b"bob")], b"unix")])
RICH = acl([
    subacl(4, sorted_entries([(b"bob@node1", 3), (b"Alice@node1", 5), (b"carol@node1", 16)]),
           b"unix"),
    subacl(16, sorted_entries([(b"staff", 1), (b"b\xc3\xb6rse", 4)])),
    subacl(8, [entry(7, b"z*@node2"), entry(2, b"a*@node3")], b"unix"),
    subacl(4, [entry(1, b"admin/node1@REALM")], b"krb5"),
    subacl(1, [entry(1)]),
    subacl(2, [entry(0x1FFF)]),
])
VALID = {
    "empty": acl([]),
    "worked_example": WORKED,
    "rich": RICH,
    "longest_mech": acl([subacl(4, [entry(1, b"x")], b"0123456789abcdef")]),
}
BROKEN = {
    "count_past_end": acl([subacl(4, [entry(3, b"bob")], b"unix")])[:-4],
    "subacl_length_past_end": acl([subacl(16, [entry(1, b"staff")], extra=40)]),
    "subacl_length_short": acl([subacl(16, [entry(1, b"staff")], extra=-6),
                                subacl(2, [entry(1)])]),
    "entry_version_7": acl([subacl(16, [entry(1, b"staff", version=7)])]),
    "unterminated_id": acl([subacl(16, [entry(1, b"staff")])])[:-1] + b"X",
    "two_anyother": acl([subacl(2, [entry(1), entry(2)])]),
    "mech_too_long": acl([subacl(4, [entry(1, b"x")], b"m" * 20)]),
    "mech_on_group": acl([subacl(16, [entry(1, b"staff")], b"unix")]),
    "id_on_anyother": acl([subacl(2, [entry(1, b"x")])]),
    "unknown_type": acl([subacl(3, [entry(1)])]),
    "unsorted_users": acl([subacl(4, [entry(1, b"zed"), entry(2, b"amy")], b"unix")]),
    "bad_version": b"\x85\x02\x02\x00\x00",
    "short_header": b"\x85\x01",
}

ACL_TEXTS = {
    "example": b"#ACL for the example resource\n\nN\no r\nU UNIX root rwcx #administrator\n"
               b"u unix joe\ng staff rw\ne unix joe w\n",
    "crlf": b"u unix bob rw\r\ng staff r\r\no r\r\n",
    "blanks_and_form_feed": b" \t\x0bg\tstaff\x0br \x0cn\r#c\n",
    "no_final_newline": b"u unix bob rw\ng staff r",
    "custom_templates": b"u unix bob Rmz\ng staff \xe9r#\no m\n",
    "every_default_permission": b"o rwcxCqledvsao\nn r\n",
    "two_mechanisms": b"u unix b\nu KRB5 a@R r\nu unix A w\ne krb5 x* r\ne unix y* w\n",
    "duplicate_user": b"u unix bob r\nu UNIX BOB w\n",
    "duplicate_group": b"g staff r\ng Staff w\n",
    "bad_type": b"x joe r\n",
    "missing_identity": b"u unix\n",
    "extra_token": b"n rw x\n",
    "bad_permission": b"g staff rz\n",
    "mech_17": b"u 0123456789abcdefg bob r\n",
    "nul_inside": b"g staff r\ng wh\0eel r\n",
    "nul_at_line_start": b"g staff r\n\0g wheel r\n",
    "line_1096": b"#" + b"x" * 1094 + b"\n" + b"o r\n",
    "line_1097": b"#" + b"x" * 1095 + b"\n",
    "non_ascii_ids": b"u unix j\xc3\xb6rg r\ng \xe9quipe w\n",
    "empty": b"",
}

BUFFER_DICT = [b"\x85\x01\x02", b"\x85\x01\x01", b"unix\x00", b"krb5\x00", b"\x01\x00\x00\x00",
               b"\x00\x00\x00\x01", b"\xff\xff\xff\xff", b"\x05unix\x00", b"\x10", b"\x08",
               b"\x04", b"\x02", b"\x01"]
FILE_DICT = [b"u unix ", b"U UNIX ", b"e unix ", b"g ", b"n ", b"o ", b"N", b"O", b"E", b"G",
             b"krb5", b"#", b"\r\n", b"\x0c", b"\x0b", b"\t", b"rw", b"rwcxCqledvsao", b"Rmz",
             b"\xe9", b"@", b"\x00"]


# kxacl_args: the first byte picks the parser (0 command line, 1 template
# file, 2 JSON quoting); command-line words are separated by NUL bytes.
ARGS_SEEDS = {
    "check_groups": b"\x00check\x00res.acl\x00--group\x00staff\x00admin\x00--json",
    "compile_all": b"\x00compile\x00res.acl\x00--user\x00root\x00--cache\x00--templates=t"
                   b"\x00-o\x00out",
    "list_filter": b"\x00list\x00--type=user\x00--mech\x00unix\x00--\x00-file",
    "add_user": b"\x00add\x00buf\x00--user\x00unix\x00ann@h\x00--perms\x00rw\x00--new",
    "perms_mask": b"\x00perms\x00--mask\x000x1f",
    "templates_ok": b"\x01# perms\nr 0 read Read it\nw 1 write\n\nx 31 exec   Run it\n",
    "templates_bad": b"\x01r 0 read\nr 1 again\n",
    "json_mixed": b"\x02caf\xc3\xa9 \x01\x80 \"q\" \\ \xed\xa0\x80",
}
ARGS_DICT = [w.encode() for w in (
    "compile", "check", "list", "add", "del", "dump", "perms", "--json", "--help",
    "--templates", "--owner", "--user", "--cache", "-o", "--output", "--text", "--buffer",
    "--unauthenticated", "--anyother", "--expanded", "--group", "--perms", "--new", "--type",
    "--mech", "--string", "--mask", "--version", "--", "#", "0x")] + [b"\x00", b"\n"]


def write_dir(name, files):
    path = os.path.join(HERE, "corpus", name)
    shutil.rmtree(path, ignore_errors=True)
    os.makedirs(path)
    for fname, data in files.items():
        with open(os.path.join(path, fname), "wb") as f:
            f.write(data)


def write_dict(name, tokens):
    with open(os.path.join(HERE, name + ".dict"), "w") as f:
        for t in tokens:
            f.write('"' + "".join("\\x%02x" % c for c in t) + '"\n')


def perms_seed(templates, mask, text):
    """An input of the perms target: FuzzedDataProvider reads integers from
    the end backwards (the template count first), and the text from the front."""
    tail = bytearray()
    tail.append(len(templates))
    for bit, char in templates:
        tail.append(1)          # a single-bit template
        tail.append(bit)        # which bit
        tail.append((char + 128) & 0xFF)  # its character (ConsumeIntegral<char> starts at -128)
    tail.append(0)              # a positive count
    tail += struct.pack("<I", mask)[::-1]
    return text + bytes(reversed(tail))


def main():
    write_dir("acl_buffer", {**VALID, **BROKEN})
    foreign = {n: other_order(b) for n, b in VALID.items()}
    foreign.update({n: b[:2] + b"\x01" + b[3:] for n, b in BROKEN.items() if len(b) > 3})
    write_dir("acl_buffer_foreign", foreign)
    write_dir("acl_file", ACL_TEXTS)
    defaults = [(i, ord(c)) for i, c in enumerate("rwcxCqledvsao")]
    write_dir("perms", {
        "defaults_rw": perms_seed(defaults, 0x3, b"rw"),
        "defaults_all": perms_seed(defaults, 0x1FFF, b"rwcxCqledvsao"),
        "unknown_char": perms_seed(defaults[:4], 0x2000, b"rwz"),
        "no_templates": perms_seed([], 0, b""),
        "top_bit": perms_seed([(31, ord("z")), (0, ord("z"))], 0x80000001, b"zz"),
    })
    write_dict("acl_buffer", BUFFER_DICT)
    write_dict("acl_buffer_foreign", BUFFER_DICT)
    write_dict("acl_file", FILE_DICT)
    write_dir("kxacl_args", ARGS_SEEDS)
    write_dict("kxacl_args", ARGS_DICT)


if __name__ == "__main__":
    main()
