#include "console_page.h"

#include "console_files.h"

namespace devserver {
namespace {

// The page shows texts from whoever talks to the server. Trusted types make a script that would
// take one for markup fail; the empty icon is the one thing that is no file.
constexpr const char *kPolicy =
    "default-src 'none'; script-src 'self'; style-src 'self'; connect-src 'self'; img-src data:; "
    "base-uri 'none'; form-action 'none'; frame-ancestors 'none'; "
    "require-trusted-types-for 'script'; trusted-types 'none'";

constexpr struct {
    std::string_view path;
    const char *szType;
    std::string_view content;
} kFiles[] = {
    {kConsolePath, "text/html; charset=utf-8", kConsoleHtml},
    {"/dev/console.css", "text/css; charset=utf-8", kConsoleCss},
    {"/dev/console.js", "text/javascript; charset=utf-8", kConsoleJs},
};

}  // namespace

std::optional<Reply> ConsoleFile(const std::string &strPath) {
    for (const auto &file : kFiles) {
        if (file.path != strPath) {
            continue;
        }
        Reply reply;
        reply.strType = file.szType;
        reply.strBody = file.content;
        // Not stored: a newer server's page would otherwise meet an older one's script.
        reply.headers = {{"Content-Security-Policy", kPolicy},
                         {"X-Content-Type-Options", "nosniff"},
                         {"Referrer-Policy", "no-referrer"},
                         {"Cache-Control", "no-store"}};
        return reply;
    }
    return std::nullopt;
}

}  // namespace devserver
