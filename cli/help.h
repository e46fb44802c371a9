// The text of --help: at most 80 columns wide, and for a program with commands a screen high.

#ifndef ZELO_HELP_H
#define ZELO_HELP_H

#include <CLI/CLI.hpp>
#include <string>

namespace help {

// To be given to a program before its commands are added to it, which take it over.
class Formatter : public CLI::FormatterBase {
  public:
    std::string make_help(const CLI::App *pApp, std::string strName,
                          CLI::AppFormatMode mode) const override;
};

}  // namespace help

#endif
