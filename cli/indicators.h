// The six indicators of membership, read through the platform one by one, with what each holds and
// which rule it breaks. The verdict is the library's (ZELOQRMClientStatus); this explains it.

#ifndef QRMCTL_INDICATORS_H
#define QRMCTL_INDICATORS_H

#include <string>
#include <vector>

namespace qrmctl {

struct Indicator {
    std::string strName;
    std::string strHolds;    // what it holds, for people
    int rule = 0;            // the rule that it breaks, 1 to 10; 0 for none
    std::string strRule;     // that rule's text, as the library logs it
    std::string strMeaning;  // what is wrong, for people
    std::string strRemedy;   // the command that mends it
};

// All six, in the order in which the library reads them.
std::vector<Indicator> ReadIndicators();

}  // namespace qrmctl

#endif
