// The exported message table of set 1 of the catalogue "kxseclib.cat".
#include <array>

#include <kx_acl.h>

#include "messages.h"

namespace {

constexpr std::array<const char *, kxacl::message_count> make_table() {
    std::array<const char *, kxacl::message_count> rows{};
    for (int i = 0; i < kxacl::message_count; ++i)
        rows[i] = kxacl::message_text(i);
    return rows;
}

constexpr auto table = make_table();
static_assert(KXSECLIB_MSG_COUNT == kxacl::message_count);

} // namespace

extern "C" {

// Spelled out element by element so that the exported array is plain data
// with no start-up code.
#define KX_ROW(i) table[(i)]
#define KX_ROW10(i)                                                                                \
    KX_ROW(i), KX_ROW((i) + 1), KX_ROW((i) + 2), KX_ROW((i) + 3), KX_ROW((i) + 4),                 \
        KX_ROW((i) + 5), KX_ROW((i) + 6), KX_ROW((i) + 7), KX_ROW((i) + 8), KX_ROW((i) + 9)
#define KX_ROW100(i)                                                                               \
    KX_ROW10(i), KX_ROW10((i) + 10), KX_ROW10((i) + 20), KX_ROW10((i) + 30), KX_ROW10((i) + 40),   \
        KX_ROW10((i) + 50), KX_ROW10((i) + 60), KX_ROW10((i) + 70), KX_ROW10((i) + 80),            \
        KX_ROW10((i) + 90)

const char *const cu_mesgtbl_kxseclib_msg[KXSECLIB_MSG_COUNT] = {
    KX_ROW100(0),  KX_ROW100(100), KX_ROW100(200), KX_ROW100(300), KX_ROW100(400), KX_ROW100(500),
    KX_ROW10(600), KX_ROW10(610),  KX_ROW(620),    KX_ROW(621),    KX_ROW(622)};

const char cu_badid_kxseclib_msg[] = "Bad message id for message set kxseclib_msg";
}
