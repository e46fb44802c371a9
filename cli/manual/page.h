// Manual pages in the troff language, made from an option table.

#ifndef ZELO_MANUAL_PAGE_H
#define ZELO_MANUAL_PAGE_H

#include <string>
#include <vector>

#include "option_table.h"

namespace manual {

struct Page {
    std::string strName;  // of its file, without the section: "qrmctl-join"
    std::string strText;
};

struct Program {
    option_table::Command command;
    std::vector<option_table::ExitStatus> statuses;
    std::vector<std::string> alsoSee;  // other pages of section 1
};

// The program's page, and one for each of its commands; a command's own commands stand in its page.
std::vector<Page> Pages(const Program &program);

}  // namespace manual

#endif
