// Fuzz target: permission strings and masks with arbitrary template sets.
// Both translations are compared with a plain model of their rules: the
// first template whose character (or whose single bit) matches wins, and a
// character or bit without one fails at once. The output buffer is sized
// exactly as the caller's contract says: one byte per set bit, and the NUL.
#include <algorithm>
#include <bit>
#include <memory>

#include <fuzzer/FuzzedDataProvider.h>

#include "dump.h"
#include "fuzz_support.h"
#include "messages.h"
#include "perms.h"

namespace {

using namespace kxfuzz;

struct model_result {
    kx_int32_t status;
    kx_uint32_t mask; // what translate_perms leaves in the mask
    std::string text; // what translate_bitmask writes, on success
    long long failed; // the character or bit shown in the failure
};

model_result model_perms(const std::vector<sec_perm_desc> &set, const char *s) {
    model_result r{SEC_S_OK, 0, "", 0};
    for (; *s; ++s) {
        auto t = std::find_if(set.begin(), set.end(),
                              [&](const sec_perm_desc &p) { return p.printchar == *s; });
        if (t == set.end())
            return {SEC_S_BAD_PERMISSION, r.mask, "", static_cast<unsigned char>(*s)};
        r.mask |= t->code;
    }
    return r;
}

model_result model_bitmask(const std::vector<sec_perm_desc> &set, kx_uint32_t mask) {
    model_result r{SEC_S_OK, mask, "", 0};
    for (int bit = 0; bit < 32; ++bit) {
        kx_uint32_t value = kx_uint32_t{1} << bit;
        if (!(mask & value))
            continue;
        auto t = std::find_if(set.begin(), set.end(),
                              [&](const sec_perm_desc &p) { return p.code == value; });
        if (t == set.end())
            return {SEC_S_BAD_PERMISSION, mask, "", static_cast<long long>(value)};
        r.text += t->printchar;
    }
    return r;
}

// The first argument of the thread's error record, as a number.
long long first_argument() {
    cu_error_t *err = nullptr;
    cu_get_error_1(&err);
    long long v = -1;
    if (err && err->cu_arg_cnt > 0) {
        const cu_error_arg_t &a = err->cu_args[0];
        if (a.cu_arg_type == CU_ERROR_ARG_INT)
            v = a.cu_arg_value.cu_arg_int;
        else if (a.cu_arg_type == CU_ERROR_ARG_LONG)
            v = a.cu_arg_value.cu_arg_long;
        else if (a.cu_arg_type == CU_ERROR_ARG_LONG_LONG)
            v = a.cu_arg_value.cu_arg_long_long;
    }
    cu_rel_error_1(err);
    return v;
}

void expect_failure_record(const model_result &m, int msg, const char *what) {
    record r = current_record();
    expect(r.id == m.status && r.msg == msg, what, r.msg);
    expect(static_cast<kx_uint32_t>(first_argument()) == static_cast<kx_uint32_t>(m.failed),
           "the failure shows another character or bit", first_argument());
}

void translate_perms(sec_perm_set_t set, const std::vector<sec_perm_desc> &model_set,
                     const std::string &text) {
    model_result m = model_perms(model_set, text.c_str());
    kx_uint32_t mask = 0xdeadbeef;
    cu_set_no_error_1();
    kx_int32_t rc = sec_translate_perms(text.c_str(), set, &mask);
    expect(rc == m.status, "sec_translate_perms status", rc);
    expect(mask == m.mask, "sec_translate_perms mask", mask);
    if (rc != SEC_S_OK)
        expect_failure_record(m, kxacl::MSG_2650_146, "sec_translate_perms record");
}

void translate_bitmask(sec_perm_set_t set, const std::vector<sec_perm_desc> &model_set,
                       kx_uint32_t mask) {
    model_result m = model_bitmask(model_set, mask);
    std::size_t room = static_cast<std::size_t>(std::popcount(mask)) + 1;
    std::unique_ptr<char[]> out(new char[room]);
    cu_set_no_error_1();
    kx_int32_t rc = sec_translate_bitmask(mask, set, out.get());
    expect(rc == m.status, "sec_translate_bitmask status", rc);
    if (rc == SEC_S_OK)
        expect(out[room - 1] == '\0' && m.text == std::string(out.get(), room - 1),
               "sec_translate_bitmask text");
    else
        expect_failure_record(m, kxacl::MSG_2650_178, "sec_translate_bitmask record");
}

// The template set from the input: up to 40 templates, single bits more
// often than not; sometimes a negative count, which stands for no templates.
std::vector<sec_perm_desc> templates_from(FuzzedDataProvider &in, kx_int32_t *count) {
    std::vector<sec_perm_desc> set(in.ConsumeIntegralInRange<std::size_t>(0, 40));
    for (sec_perm_desc &p : set) {
        p.code = in.ConsumeBool() ? kx_uint32_t{1} << in.ConsumeIntegralInRange(0, 31)
                                  : in.ConsumeIntegral<kx_uint32_t>();
        p.printchar = in.ConsumeIntegral<char>();
        std::snprintf(p.printstring, sizeof p.printstring, "t%u", p.code);
    }
    *count = in.ConsumeBool() && !set.empty() ? -static_cast<kx_int32_t>(set.size())
                                              : static_cast<kx_int32_t>(set.size());
    return set;
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    trace_to_null();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    trace_levels_for(size);
    FuzzedDataProvider in(data, size);
    kx_int32_t count = 0;
    std::vector<sec_perm_desc> templates = templates_from(in, &count);
    // Exactly count templates on the heap, or none at all.
    std::unique_ptr<sec_perm_desc[]> held;
    if (!templates.empty()) {
        held.reset(new sec_perm_desc[templates.size()]);
        std::copy(templates.begin(), templates.end(), held.get());
    }
    sec_perm_set_desc set{count, held.get()};
    std::vector<sec_perm_desc> model_set = count > 0 ? templates : std::vector<sec_perm_desc>{};
    kx_uint32_t mask = in.ConsumeIntegral<kx_uint32_t>();
    std::string text = in.ConsumeRemainingBytesAsString();

    translate_perms(&set, model_set, text);
    translate_bitmask(&set, model_set, mask);
    // The default set, through the exported function's null set.
    sec_perm_set_desc defaults = kxacl::acl__default_perm_set;
    std::vector<sec_perm_desc> default_model(defaults.perms, defaults.perms + defaults.count);
    translate_perms(nullptr, default_model, text);
    translate_bitmask(nullptr, default_model, mask);

    // The dump of an entry with these templates prints its line or the failure.
    sec_acle_desc entry{mask, "", SEC_ACLE_ANYOTHER, nullptr};
    silenced quiet;
    kxacl::sec__dump_acle(&entry, &set, "\t");
    return 0;
}
