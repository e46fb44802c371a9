// Benchmarks as ratios: each row measures a subject of this project against a named peer that gets
// the same done by the shortest way.
//
// Both sides of a row take turns, operation by operation, so that whatever else the machine does
// meets both alike. Each pair of turns gives the ratio of the subject's time to the peer's; the
// row's ratio is the median over the pairs of a repetition, and then over the repetitions.

#ifndef ZELO_BENCH_RATIO_TABLE_H
#define ZELO_BENCH_RATIO_TABLE_H

#include <functional>
#include <string>

namespace bench {

// What takes its turn. The functions own what they work on.
struct Side {
    std::function<bool()> operation;  // is measured; false: it failed, and with it the row
    std::function<bool()> undo;       // not measured: brings back what the operation found; or null

    // In place of the operation: measures by itself, in a child process or in another unit than
    // seconds, and returns the measure; a negative one: it failed.
    std::function<double()> measure = nullptr;
};

struct Pair {
    Side subject;
    Side peer;
};

struct Row {
    std::string strName;
    std::string strPeer;
    double goal = 0;              // the highest ratio that meets it, as both are shown
    std::function<Pair()> setUp;  // makes both sides anew for each repetition; may throw

    // The name of an earlier row for the same operation on fewer records, or empty. The ratio must
    // not be higher than there: the subject may grow only as its peer does.
    std::string strSmaller;

    // For a slow operation: so many pairs of turns, all on one set-up. 0: as many as the time of a
    // repetition has room for, in each of several repetitions.
    int pairs = 0;
};

void AddRow(const Row &row);

// Throws with the text as its reason unless the condition holds; for setUp.
void Require(bool blHolds, const std::string &strReason);

// The time that the operation takes; -1 when it fails.
double Seconds(const std::function<bool()> &operation);

// Measures the rows and writes the table to standard output, with a line at its end that says how
// it went. The arguments are Google Benchmark's (--benchmark_filter=REGEX chooses rows). Returns
// the program's exit status: 0 when every goal is met, 1 when one is missed or a row could not be
// measured, 2 for wrong arguments.
int Run(int argc, char **argv);

}  // namespace bench

#endif
