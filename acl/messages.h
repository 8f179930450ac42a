// The default texts of the messages that this library reports, by their
// index in set 1 of the catalogue "kxseclib.cat", and the placeholder rules
// that the reporting helpers check at compile time.
#ifndef KXACL_MESSAGES_H
#define KXACL_MESSAGES_H

namespace kxacl {

// Message indices. The catalogue number of each is in its name.
enum msg : int {
    MSG_DUMP_INVALID = 82,
    MSG_DUMP_ACL = 83,
    MSG_DUMP_SUBACL = 84,
    MSG_DUMP_ACLE_MECH = 85,
    MSG_DUMP_ACLE_ID = 86,
    MSG_DUMP_ACLE = 87,
    MSG_2650_101 = 88,
    MSG_2650_102 = 89,
    MSG_2650_104 = 91,
    MSG_2650_106 = 93,
    MSG_2650_107 = 94,
    MSG_2650_108 = 95,
    MSG_2650_109 = 96,
    MSG_2650_110 = 97,
    MSG_2650_111 = 98,
    MSG_2650_113 = 100,
    MSG_2650_114 = 101,
    MSG_2650_115 = 102,
    MSG_2650_116 = 103,
    MSG_2650_117 = 104,
    MSG_2650_118 = 105,
    MSG_2650_119 = 106,
    MSG_2650_120 = 107,
    MSG_2650_121 = 108,
    MSG_2650_122 = 109,
    MSG_2650_123 = 110,
    MSG_2650_124 = 111,
    MSG_2650_125 = 112,
    MSG_2650_126 = 113,
    MSG_2650_127 = 114,
    MSG_2650_128 = 115,
    MSG_2650_129 = 116,
    MSG_2650_130 = 117,
    MSG_2650_131 = 118,
    MSG_2650_132 = 119,
    MSG_2650_134 = 121,
    MSG_2650_135 = 122,
    MSG_2650_137 = 124,
    MSG_2650_139 = 126,
    MSG_2650_140 = 127,
    MSG_2650_141 = 128,
    MSG_2650_142 = 129,
    MSG_2650_143 = 130,
    MSG_2650_144 = 131,
    MSG_2650_145 = 132,
    MSG_2650_146 = 133,
    MSG_2650_147 = 134,
    MSG_2650_148 = 135,
    MSG_2650_149 = 136,
    MSG_2650_150 = 137,
    MSG_2650_151 = 138,
    MSG_2650_152 = 139,
    MSG_2650_154 = 141,
    MSG_2650_155 = 142,
    MSG_2650_157 = 144,
    MSG_2650_158 = 145,
    MSG_2650_165 = 151,
    MSG_2650_166 = 152,
    MSG_2650_167 = 153,
    MSG_2650_172 = 158,
    MSG_2650_173 = 159,
    MSG_2650_174 = 160,
    MSG_2650_175 = 161,
    MSG_2650_177 = 163,
    MSG_2650_178 = 164,
    MSG_2650_179 = 165,
    MSG_2650_180 = 166,
};

inline constexpr int message_count = 623;
inline constexpr const char catalogue_name[] = "kxseclib.cat";
inline constexpr int catalogue_set = 1;

// The default text of a message; "" for the messages of other components.
constexpr const char *message_text(int index) {
    switch (index) {
    case 0:
        return "Reserved: DO NOT USE!";
    case MSG_DUMP_INVALID:
        return "The ACL provided is not valid!\n";
    case MSG_DUMP_ACL:
        return "ACL descriptor: %1$s byte(s) long\n\tVersion: %2$d\n\tByte Ordering: "
               "%3$d\n\tNumber "
               "of sub-ACLs: %4$d\n";
    case MSG_DUMP_SUBACL:
        return "%1$sSubacl:\n%2$s(length = %3$d byte(s); type = %4$d; mech = %5$s; ACLE count = "
               "%6$d)\n";
    case MSG_DUMP_ACLE_MECH:
        return "%1$stype = %2$c; mech = %3$s; id = %4$s; permission = %5$s\n";
    case MSG_DUMP_ACLE_ID:
        return "%1$stype = %2$c; id = %3$s; permission = %4$s\n";
    case MSG_DUMP_ACLE:
        return "%1$stype = %2$c; permission = %3$s\n";
    case MSG_2650_101:
        return "2650-101 Failure: incorrect parameters provided.\n\tFunction name: "
               "%1$s\n\tPositional "
               "parameter number: %2$d\n\tParameter value: 0x%3$x\nIf this failure is encountered "
               "during the execution of the Cluster software\ntrusted services, contact Vesmark "
               "Customer Support and report this incident.\nIf this failure is encountered during "
               "the execution of other software,\nverify that the software is using this function "
               "correctly.\n";
    case MSG_2650_102:
        return "2650-102 Failure: Memory allocation failure.\n\tFunction name: %1$s\n\tAttempted "
               "allocation: %2$d bytes\nMost often, this failure occurs when a process exceeds its "
               "memory allocation\nlimit.  In rare cases, this failure occurs when a number of "
               "processes\nallocate huge amounts of memory and utilize all available memory on "
               "the\nsystem.  Verify that the allocation itself is not exceeding its own "
               "limit.\nIf "
               "a Cluster software trusted service is exceeding its limit, contact "
               "Vesmark\nCustomer Support and report this incident.  If another software "
               "application\nis exceeding its limit, examine the software for memory management "
               "problems\nand memory leaks.  If the application is not exceeding its memory "
               "allocation\nlimits, contact the system administrator and report this incident.  "
               "System\nadministrators should identify processes using excessive memory and "
               "consider\nterminating these processes.\n";
    case MSG_2650_104:
        return "2650-104 Internal failure detected.\n\tFile name: %1$s\n\tLine number: "
               "%2$d\n\tError "
               "code: %3$d\nContact Vesmark Customer Support and report this incident.\n";
    case MSG_2650_106:
        return "2650-106 Failure: The access control list provided to this\nroutine is either "
               "incorrect or corrupted.  Verify that the ACL was obtained from\nthe ACL library "
               "and that it was not modified or released since.\n";
    case MSG_2650_107:
        return "2650-107 Failure: The type of the access control entry\n(ACLE) provided to this "
               "routine (%1$d) is of a wrong or unknown type.  Valid ACLE\ntypes are "
               "unauthenticated (1), any-other (2), user (4), expanded (8) and\ngroup (16).\n";
    case MSG_2650_108:
        return "2650-108 Failure: The access control entry (ACLE) provided to this\nroutine does "
               "not have a valid mechanism mnomonic or identifier.  User and\nexpanded ACLEs "
               "require both; group ACLEs require an identifier.\n";
    case MSG_2650_109:
        return "2650-109 Failure: The access control (ACL) buffer provided\nto this routine does "
               "not appear to be a valid ACL buffer.  Verify that the buffer\nwas obtained from "
               "the ACL library and that it was not modified since.\n";
    case MSG_2650_110:
        return "2650-110 Failure: The access control (ACL) buffer provided\nto this routine "
               "appears to be corrupted.  The lengths of its sub-ACLs or\nentries do not agree "
               "with its contents.\n(File name: %1$s; line number: %2$d)\n";
    case MSG_2650_111:
        return "2650-111 Failure: The access control list (ACL) buffer/file\nprovided to this "
               "routine appears to be corrupted.  In any ACL, there can\nbe only one ACL entry "
               "(ACLE) of type 'unauthenticated' or 'anyother'.  Verify\nthat the ACL was obtained "
               "from the ACL library and that it was not modified.\n";
    case MSG_2650_113:
        return "2650-113 Failure: The buffer provided by the caller for\nthe second argument is "
               "not a valid ACL buffer (type).  Verify that the buffer was\nobtained from the ACL "
               "library.\n";
    case MSG_2650_114:
        return "2650-114 Failure: The ACL buffer provided by the caller\nfor the second argument "
               "does not have a supported version.  Valid ACL buffer\nversions are version 1.  "
               "Verify that the buffer was obtained from the ACL library.\n";
    case MSG_2650_115:
        return "2650-115 Failure: The ACL buffer provided by the caller\nfor the second argument "
               "does not have the correct byte ordering for the \nmachine.  Convert the buffer to "
               "the byte ordering of this machine before\nusing it.\n";
    case MSG_2650_116:
        return "2650-116 Failure: The type of the access control entry\n(ACLE) provided to this "
               "routine (%1$d) is of a wrong or unknown type.  Valid ACLE\ntypes are "
               "unauthenticated (1), any-other (2), user (4), expanded (8) and\ngroup (16).\n";
    case MSG_2650_117:
        return "2650-117 Failure: The type of the access control entry\n(ACLE) provided to this "
               "routine (%1$d) requires either a valid mechanism\nmnemonic or an identifier, or "
               "both.  User and expanded ACLEs require both;\ngroup ACLEs require an "
               "identifier.\n";
    case MSG_2650_118:
        return "2650-118 Failure: The access control list (ACL) provided\nto the routine does not "
               "contain an access control list entry (ACLE) that\nmatches the type (%1$d), the "
               "mechanism (%2$s), and the identifier (%3$s)\nof the ACLE provided.\n";
    case MSG_2650_119:
        return "2650-119 Failure: The access control list (ACL) provided\nis not valid.  Its "
               "length "
               "(%1$d) is smaller than the size of an ACL buffer\nheader.\n(File name: %2$s; line "
               "number: %3$d)\n";
    case MSG_2650_120:
        return "2650-120 Failure: The type of access control list entries\n(ACLEs) in the current "
               "sub-ACL (%1$d) is of a wrong or unknown type.  Valid\nsub-ACL types are "
               "unauthenticated (1), any-other (2), user (4), expanded (8)\nand group (16).\n(File "
               "name: %2$s; line number: %3$d)\n";
    case MSG_2650_121:
        return "2650-121 Failure: The type of access control list entries\n(ACLEs) in the current "
               "sub-ACL (%1$d) should not contain any mechanism.  Only\n'user' and 'expanded' "
               "sub-ACLs carry a mechanism mnemonic.\n(File name: %2$s; line number: %3$d)\n";
    case MSG_2650_122:
        return "2650-122 Failure: An access control list (ACL) can have\nat most one entry of type "
               "'unauthenticated' or 'anyother' each.  The ACL\nprovided contains more than one.\n"
               "(File name: %1$s; line number: %2$d)\n";
    case MSG_2650_123:
        return "2650-123 Failure: The access control list (ACL) provided\ncontains a 'user' "
               "sub-ACL "
               "with an incorrect length for the mechanism mnemonic: %1$d.  The\nlength of a "
               "mechanism mnemonic must be greater than 1 and less or equal\nthan 16 bytes.\n(File "
               "name: %2$s; line number: %3$d)\n";
    case MSG_2650_124:
        return "2650-124 Failure: The access control list (ACL) provided\ncontains a 'user' "
               "sub-ACL "
               "with an incorrect mechanism mnemonic: %1$s.  The\nlength of a mechanism mnemonic "
               "must be greater than 1 and less or equal\nthan 16 bytes.\n(File name: %2$s; line "
               "number: %3$d)\n";
    case MSG_2650_125:
        return "2650-125 Failure: The access control list (ACL) contains\ncontains an access "
               "control list entry (ACLE) with a version that is not supported\nby the ACL library "
               "(%1$d).  The only supported ACLE version is 1.\n(File name: %2$s; line number: "
               "%3$d)\n";
    case MSG_2650_126:
        return "2650-126 Failure:  The access control list (ACL) contains\nan access control list "
               "entry (ACLE) of type 'unauthenticated' or 'anyother'\nthat has an identifier with "
               "length greater than zero (0).\n(File name: %2$s; line number: %3$d)\n";
    case MSG_2650_127:
        return "2650-127 Failure:  The access control list (ACL) contains\nan access control list "
               "entry (ACLE) of type 'user' or 'group' that has an\nincorrect identifier: the "
               "length of the identifier in the ACLE does not match\nthe length of the identifier "
               "string.\n(File name: %2$s; line number: %3$d)\n";
    case MSG_2650_128:
        return "2650-128 Failure: The type of the access control entry\n(ACLE) provided to this "
               "routine (%1$d) is of a wrong or unknown type.  Valid\ntypes are unauthenticated "
               "(1), any-other (2), user (4) and expanded (8).\n";
    case MSG_2650_129:
        return "2650-129 Failure: The type of the access control entry\n(ACLE) provided to this "
               "routine requires a valid mechanism mnemonic that\nis not NULL or empty string.  "
               "Provide the mechanism mnemonic of the identity.\n";
    case MSG_2650_130:
        return "2650-130 Failure: The type of the access control entry\n(ACLE) provided to this "
               "routine requires a valid identifier that is not NULL\nor empty string.  Provide "
               "the identifier of the identity.\n";
    case MSG_2650_131:
        return "2650-131 Internal failure: The ACL library is unable to\nlock/unlock the internal "
               "state data.\n\tFile name: %1$s\n\tLine number: %2$d\n\tError code: %3$d\nContact "
               "Vesmark Customer Support and report this incident.\n";
    case MSG_2650_132:
        return "2650-132 Failure: The mechanism mnemonic provided to\nthe routine for the first "
               "argument is not valid.  A mechanism mnemonic must be\nat least 1 and at most 16 "
               "characters long.\n";
    case MSG_2650_134:
        return "2650-134 Failure: The username provided is not valid.\nA valid user name does not "
               "start with the NULL ('\\0') character and is configured\non the local host.  "
               "Please provide a valid user name.\n";
    case MSG_2650_135:
        return "2650-135 Failure: The C/ACL file name provided (%1$s)\nis not valid. The ACL "
               "library is either unable to find such a file or the\nnfile is not a regular "
               "file.  The following error was returned by the\nsystem: %2$d.\n";
    case MSG_2650_137:
        return "2650-137 Failure: Unable to open the ACL file: %1$s.\nThe following error was "
               "returned by the open() subroutine: %2$d.\nPlease verify that the file exists and "
               "that it can be read by this process.\n";
    case MSG_2650_139:
        return "2650-139 Failure: An error occurred while reading the\nACL file.  The ACL library "
               "was able to read only %1$d bytes out of a total\nof %2$d bytes that represents the "
               "size of the file.  The read routine returned\nthe following errno: %3$d.  Please "
               "check the ACL file for validity.\n";
    case MSG_2650_140:
        return "2650-140 Failure: The user provided to the routine (%1$s)\ncannot be found on this "
               "system.  Please provide a valid user.\n";
    case MSG_2650_141:
        return "2650-141 Failure: The ACL file provided or its correspondent CACL file\nare not "
               "owned by the username provided by the caller, or their file permissions\nallow "
               "others than to owner to write to it, or the CACL file had different\nfile "
               "permissions than the corresponding ACL file.\nACL/CACL file name: %1$s\nUser name: "
               "%2$s\nPlease correct the ownership or the permissions of the files.\n";
    case MSG_2650_142:
        return "2650-142 Failure: The ACL library is unable to initialize\nthe data structures "
               "necessary to convert between the codeset used by this\napplication and the UTF-8 "
               "data encoding format.  Verify that the locale of the\napplication is installed "
               "and supported.\n";
    case MSG_2650_143:
        return "2650-143 Failure: The ACL library is unable to translate\na character string "
               "between the application codeset and the UTF-8 data the\nUTF-8 data encoding "
               "format.  Verify that the string is valid in the codeset\nit is given in.\n";
    case MSG_2650_144:
        return "2650-144 Failure: An error occurred while parsing the\nACL file.  It appears that "
               "the ACLE at line %1$d in the ACL file is corrupted\nor contains characters that "
               "are not understood by the ACL library.  Please edit\nthe ACL file and correct the "
               "ACLE.\n";
    case MSG_2650_145:
        return "2650-145 Failure: An error occurred while parsing the\nACL file.  The mechanism "
               "mnemonic (%1$s) at line (%2$d) is not valid:\nit is longer than the maximum 16 "
               "characters allowed.  Please edit the ACL\nfile and provide a valid mechanism "
               "mnemonic. \n";
    case MSG_2650_146:
        return "2650-146 Failure: One of the characters in the ACLE's\npermission ('%1$c') does "
               "not "
               "correspond to a valid permission template.  Verify\nthat the permission uses only "
               "characters of the permission template set.\n";
    case MSG_2650_147:
        return "2650-147 Failure: The access control list (ACL) does\nnot contain an entry (ACLE) "
               "that corresponds to the type (%1$d), and, possibly,\nthe mechanism (%2$s) and the "
               "identifier (%3$s) provided.  Make sure the\nACL contains such an entry.\n";
    case MSG_2650_148:
        return "2650-148 Failure: The access control list (ACL) file name\n(%1$s) is longer or the "
               "same length as the the maximum allowed for a file\nname.  This condition makes is "
               "impossible for the cached ACL (CACL) file\nto exist.  The CACL file has the same "
               "name as the ACL file with the added\nextension of '.cacl'.  Please use a shorter "
               "name for the ACL file.\n";
    case MSG_2650_149:
        return "2650-149 Failure: The access control list (ACL) file\n(%1$s) and its corresponding "
               "cached ACL (CACL) file do not have the same\nownership (user or group).  Please "
               "change the ownership of the CACL file\nto be the same as the ownership of the ACL "
               "file.\n";
    case MSG_2650_150:
        return "2650-150 Failure: The access control list (ACL) file\n(%1$s) and its corresponding "
               "cached ACL (CACL) file do not have the same\nfile permission .  Please change the "
               "permission of the CACL file to be the\nsame as the permission of the ACL file.\n";
    case MSG_2650_151:
        return "2650-151 Failure: Unable to open file (%1$s) for writing.\nPlease verify that "
               "there "
               "is sufficient space on the file system.\n";
    case MSG_2650_152:
        return "2650-152 Failure: An error occurred while writing the\ncompiled ACL to the caching "
               "file.  The ACL library was able to write only\n%1$d bytes out of a total of %2$d "
               "bytes that represents the size of the compiled\nACL.  The write routine returned "
               "the following errno: %3$d.  Please verify\nthat there is sufficient space on the "
               "file system.\n";
    case MSG_2650_154:
        return "2650-154 Failure: An error occurred while trying to set\nthe ownership of the "
               "cached ACL (CACL) file (%1$s) to user id %2$s and group\nid %3$d.  Make sure that "
               "the process calling this routine is running as root.\n";
    case MSG_2650_155:
        return "2650-155 Failure: An error occurred while trying to set\nthe file permission of "
               "the "
               "cached ACL (CACL) file (%1$s) to 0x%2$x.  Make\nsure that the process calling this "
               "routine has sufficient authority to change\nthe file permission on the CACL "
               "file.\n";
    case MSG_2650_157:
        return "2650-157 Failure: Duplicate entries in the ACL.  The ACL already\ncontains an "
               "entry "
               "with identical type and/or mechanism mnemonic and/or identity.\nACLE type: %1$c; "
               "mechanism: %2$s; identity: %3$s.\nPlease remove the duplicate entry.\n";
    case MSG_2650_158:
        return "2650-158 Failure: The ACL entry at line %1$d in the ACL\nfile is longer than the "
               "maximum allowed of 1096 characters, including\nthe end of line character.  Make "
               "sure that the ACL file does not contain\nany line longer than 1024 characters.\n";
    case MSG_2650_165:
        return "2650-165 Failure: The ACL file name provided (%1$s)\nis not valid in combination "
               "with providing a user name (%2$s).\nWhen a username is provided to the command, "
               "the file name must not contain\nany path, absolute or relative, and the file must "
               "reside in the user's home\ndirectory.  The path of the file in the home directory "
               "must not be longer\nthan 4096 characters.\n";
    case MSG_2650_166:
        return "2650-166 Failure: Unable to determine the current working\ndirectory! (routine: "
               "%1$s; errno: %2$d)\nPlease report this condition to the system administrator.\n";
    case MSG_2650_167:
        return "2650-167 Failure: The path to the current working directory\nis too long for the "
               "name of the ACL file.\nCurrent working directory: %1$s\nACL file name: %2$s\nThe "
               "full path of the ACL file must not be longer than 4096 characters.\n";
    case MSG_2650_172:
        return "2650-172 Failure: An error occurred while parsing the\nACL file.  It appears that "
               "the ACLE at line %1$d in the ACL file is missing\none or more tokens.  Please edit "
               "the ACL file and correct the ACLE.\n";
    case MSG_2650_173:
        return "2650-173 Failure: An error occurred while parsing the\nACL file.  It appears that "
               "the ACLE at line %1$d in the ACL file has more\ntokens than expected.  Please edit "
               "the ACL file and correct the ACLE.\n";
    case MSG_2650_174:
        return "2650-174 Failure: Duplicate 'anyother' or 'unauthenticated' entries in\nthe ACL.  "
               "The ACL already contains an entry with identical type.\nACLE type: %1$c.\nPlease "
               "remove the duplicate entry.\n";
    case MSG_2650_175:
        return "2650-175 Failure: Duplicate 'group' entries in ACL.  The ACL already\ncontains a "
               "group with an identical identifier.\nACLE type: %1$c; ACLE identifier: "
               "%2$s.\nPlease remove the duplicate entry.\n";
    case MSG_2650_177:
        return "2650-177 Failure: Unable to rename the temporary ACL cache file to its\npermanent "
               "name.\nTemporary CACL file: %1$s\nPermanent CACL file: %2$s\nPlease verify that "
               "the directory of the ACL file can be written by this process.\n";
    case MSG_2650_178:
        return "2650-178 Failure: One of the bits in the ACLE's bit-mask permission\n(0x%1$08x) "
               "does not correspond to a valid permission template.  Verify\nthat the permission "
               "uses only bits of the permission template set.\n";
    case MSG_2650_179:
        return "2650-179 Failure: An error occurred while parsing the ACL file.\nIt appears that "
               "the ACLE at line %1$d in the ACL file does not have a valid\nACLE type (%2$s).  A "
               "valid ACLE type is one of the following characters:\n\t'n'/'N' for "
               "unauthenticated ACLE;\n\t'o'/'O' for any-other ACLE;\n\t'u'/'U' for user "
               "ACLEs;\n\t'e'/'E' for expanded ACLEs; and\n\t'g'/'G' for group ACLEs.\nPlease edit "
               "the ACL file and correct the ACLE.\n";
    case MSG_2650_180:
        return "2650-180 Failure: An error occurred while parsing the ACL file.\nIt appears that "
               "the ACLE at line %1$d in the ACL file does not have a valid\npermission set "
               "(%2$s).\nPlease verify that the character representation of the permissions "
               "used\ncorresponds to the permission template set used.\n";
    default:
        return "";
    }
}

// Kind of argument that a placeholder takes.
enum class arg_kind { none, integer, text };

// The kind that placeholder number n of a message takes: integer for the
// integer conversions (and for a number that the text skips below its
// highest), text for %s, none above the highest number.
constexpr arg_kind placeholder_kind(const char *text, int n) {
    arg_kind kind = arg_kind::none;
    int highest = 0;
    for (const char *p = text; *p; ++p) {
        if (*p != '%' || p[1] == '\0')
            continue;
        if (p[1] == '%') {
            ++p;
            continue;
        }
        int number = 0;
        const char *q = p + 1;
        while (*q >= '0' && *q <= '9')
            number = number * 10 + (*q++ - '0');
        if (*q != '$')
            continue;
        ++q;
        while (*q == '0' || (*q >= '1' && *q <= '9') || *q == '-' || *q == '#')
            ++q;
        if (number > highest)
            highest = number;
        if (number == n)
            kind = *q == 's' ? arg_kind::text : arg_kind::integer;
    }
    if (kind == arg_kind::none && n <= highest)
        kind = arg_kind::integer;
    return kind;
}

// Number of arguments that a message takes: its highest placeholder number.
constexpr int placeholder_count(const char *text) {
    int n = 0;
    while (placeholder_kind(text, n + 1) != arg_kind::none)
        ++n;
    return n;
}

} // namespace kxacl

#endif
