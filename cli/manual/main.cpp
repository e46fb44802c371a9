// make_manual: writes the manual pages and the shells' completions of the tools into a folder. A
// program of the build; it is not installed.

#include <cstdlib>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <stdexcept>

#include "../../devserver/command_line.h"
#include "../command_line.h"
#include "../command_texts.h"
#include "completion.h"
#include "page.h"

namespace {

namespace fs = std::filesystem;

void Write(const fs::path &file, const std::string &strText) {
    fs::create_directories(file.parent_path());
    std::ofstream stream(file, std::ios::binary);
    stream << strText;
    stream.close();
    if (!stream) {
        throw std::runtime_error("cannot write '" + file.string() + "'");
    }
}

void WriteAll(const fs::path &folder, const manual::Program &program) {
    for (const manual::Page &page : manual::Pages(program)) {
        Write(folder / "man/man1" / (page.strName + ".1"), page.strText);
    }
    const std::string &strName = program.command.strName;
    Write(folder / "bash-completion/completions" / strName,
          manual::BashCompletion(program.command));
    Write(folder / "zsh/site-functions" / ("_" + strName), manual::ZshCompletion(program.command));
    Write(folder / "fish/vendor_completions.d" / (strName + ".fish"),
          manual::FishCompletion(program.command));
}

void Run(const fs::path &folder) {
    const std::vector<std::string> pages = {"qrmctl", "qrm-devserver", "box"};

    const command::Program qrmctl("qrmctl", qrmctl::kSummary, qrmctl::kVersion);
    qrmctl::Action action;
    qrmctl::CommonOptions common;
    qrmctl::AddCommandLine(qrmctl.Root(), action, common);
    WriteAll(folder, {qrmctl.Table(), qrmctl::ExitStatuses(), pages});

    const command::Program server("qrm-devserver", devserver::kSummary, devserver::kVersion);
    devserver::Options options;
    devserver::Files files;
    devserver::AddCommandLine(server.Root(), options, files);
    WriteAll(folder, {server.Table(), devserver::ExitStatuses(), pages});
}

}  // namespace

int main(int argc, char **argv) {
    if (argc != 2) {
        std::cerr << "usage: make_manual FOLDER\n";
        return EXIT_FAILURE;
    }
    try {
        Run(argv[1]);
        return EXIT_SUCCESS;
    } catch (const std::exception &error) {
        std::cerr << "make_manual: " << error.what() << '\n';
        return EXIT_FAILURE;
    }
}
