// kxacl: compile, check, explain, lint, diff, list, edit, dump and install
// ACLs from the command line.
#include <cstdio>
#include <exception>
#include <new>
#include <string>

#include "acl_io.h"
#include "commands.h"
#include "json.h"
#include "options.h"

namespace {

using namespace kxtool;

// The kinds of failure, as JSON names them: a command line that is not one
// (with where to read more), a file or value the tool cannot use, and a
// failure of the library (with its status and message number).
enum class failure_kind { usage, tool, library };

// Reports a failure on standard error, and as JSON on standard output when
// JSON was asked for, so that scripts always get a document to parse.
int report_failure(bool json, failure_kind kind, const std::string &message,
                   const library_error *lib = nullptr, const std::string &help = {}) {
    std::fputs(message.c_str(), stderr);
    if (json) {
        static constexpr const char *kinds[] = {"usage", "tool", "library"};
        json_writer out;
        out.begin_object().key("error").begin_object();
        out.key("kind").value(kinds[static_cast<int>(kind)]);
        if (lib) {
            out.key("status").value(static_cast<std::int64_t>(lib->status)).key("id");
            lib->id.empty() ? out.null() : out.value(lib->id);
        }
        if (!help.empty())
            out.key("help").value(help);
        out.key("message").value(message).end_object().end_object();
        std::fputs(out.str().c_str(), stdout);
    }
    return exit_error;
}

int run(int argc, char **argv) {
    const parsed p = parse_command_line(
        std::span<const char *const>(argv + 1, static_cast<std::size_t>(argc > 0 ? argc - 1 : 0)));
    if (!p.error.empty())
        return report_failure(p.inv.json, failure_kind::usage,
                              "kxacl: " + p.error + "\nTry '" + p.help_hint() + "'.\n", nullptr,
                              p.help_hint());
    if (p.inv.version) {
        std::fputs("kxacl " KXACL_VERSION "\n", stdout);
        return exit_ok;
    }
    if (p.inv.help) {
        std::fputs(p.inv.cmd == command::none ? usage_summary() : command_help(p.inv.cmd), stdout);
        return exit_ok;
    }
    try {
        return run_command(p.inv);
    } catch (const library_error &e) {
        return report_failure(p.inv.json, failure_kind::library, e.what(), &e);
    } catch (const tool_error &e) {
        return report_failure(p.inv.json, failure_kind::tool,
                              "kxacl: " + std::string(e.what()) + "\n");
    }
}

} // namespace

// A result that could not be written whole is a failure, not a success
// with missing output (a full disk, a closed pipe).
int flush_output(int status) {
    if (std::fflush(stdout) != 0 || std::ferror(stdout)) {
        std::fputs("kxacl: cannot write the output\n", stderr);
        return exit_error;
    }
    return status;
}

int main(int argc, char **argv) {
    try {
        return flush_output(run(argc, argv));
    } catch (const std::bad_alloc &) {
        std::fputs("kxacl: out of memory\n", stderr);
    } catch (const std::exception &e) {
        std::fprintf(stderr, "kxacl: %s\n", e.what());
    }
    return exit_error;
}
