#include "ratio_table.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <exception>
#include <map>
#include <set>
#include <stdexcept>
#include <vector>

namespace bench {
namespace {

// Of measured time, both sides together.
constexpr double kRepetition_s = 0.4;
constexpr int kRepetitions = 5;

// No growth, but for the noise of two measurements: on a busy disk each is off by up to a tenth.
constexpr double kGrowthGoal = 1.2;

std::map<std::string, Row> &Rows() {
    static std::map<std::string, Row> rows;
    return rows;
}

double Median(std::vector<double> &values) {
    const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
    std::nth_element(values.begin(), middle, values.end());
    return *middle;
}

// One turn: the seconds that the operation took, or what it measured itself.
double TakeTurn(const Side &side, const std::string &strSide) {
    const double measure = side.measure != nullptr ? side.measure() : Seconds(side.operation);
    Require(measure >= 0 && (side.undo == nullptr || side.undo()), strSide + " failed");
    return measure;
}

// A ratio as it is shown: with as many decimals as its goal needs.
std::string Shown(double ratio, double goal) {
    char szText[32];
    std::snprintf(szText, sizeof(szText), goal < 0.1 ? "%.4f" : "%.2f", ratio);
    return szText;
}

// A row as Google Benchmark runs it.
class Contest : public benchmark::Fixture {
  public:
    explicit Contest(const Row &row) : m_row(row) {
        SetName(row.strName.c_str());
        UseManualTime();
        if (row.pairs > 0) {
            Iterations(row.pairs);
            return;
        }
        MinTime(kRepetition_s);
        Repetitions(kRepetitions);
    }

  protected:
    void BenchmarkCase(benchmark::State &state) override {
        try {
            state.counters["ratio"] = Measure(state, m_row.setUp());
        } catch (const std::exception &error) {
            state.SkipWithError(error.what());
        }
    }

  private:
    double Measure(benchmark::State &state, const Pair &pair) const {
        const auto subject_s = [&] { return TakeTurn(pair.subject, "the subject"); };
        const auto peer_s = [&] { return TakeTurn(pair.peer, m_row.strPeer); };
        // A first turn opens connections and fills caches.
        subject_s();
        peer_s();
        std::vector<double> ratios;
        while (state.KeepRunning()) {
            const bool blSubjectFirst = ratios.size() % 2 == 0;
            const double first_s = blSubjectFirst ? subject_s() : peer_s();
            const double second_s = blSubjectFirst ? peer_s() : subject_s();
            ratios.push_back(blSubjectFirst ? first_s / second_s : second_s / first_s);
            state.SetIterationTime(first_s + second_s);
        }
        return Median(ratios);
    }

    const Row m_row;
};

class Table : public benchmark::BenchmarkReporter {
  public:
    bool ReportContext(const Context & /*context*/) override {
        std::printf("%-56s %6s %6s  %-6s  %s\n", "row", "ratio", "goal", "", "peer");
        return true;
    }

    void ReportRuns(const std::vector<benchmark::BenchmarkReporter::Run> &runs) override {
        for (const auto &run : runs) {
            const Row &row = Rows().at(run.run_name.function_name);
            if (run.error_occurred && m_failed.insert(row.strName).second) {
                std::printf("%-56s cannot be measured: %s\n", row.strName.c_str(),
                            run.error_message.c_str());
            } else if (run.aggregate_name == (row.pairs > 0 ? "" : "median") &&
                       m_failed.count(row.strName) == 0) {
                ReportRatio(row, run.counters.at("ratio"));
            }
        }
        std::fflush(stdout);
    }

    // Writes the last line.
    bool Conclude() const {
        std::printf("%d of %d goals are met%s.\n", m_met, m_shown,
                    m_failed.empty() ? "" : ", and not every row could be measured");
        return m_shown > 0 && m_met == m_shown && m_failed.empty();
    }

  private:
    void ReportRatio(const Row &row, double ratio) {
        m_ratios[row.strName] = ratio;
        Show(row.strName, ratio, row.goal, row.strPeer);
        const auto smaller = m_ratios.find(row.strSmaller);
        if (smaller != m_ratios.end()) {
            Show("  its growth", ratio / smaller->second, kGrowthGoal, "the peer's growth");
        }
    }

    void Show(const std::string &strName, double ratio, double goal, const std::string &strPeer) {
        const std::string strRatio = Shown(ratio, goal);
        const bool blMet = std::stod(strRatio) <= goal;
        ++m_shown;
        m_met += blMet ? 1 : 0;
        std::printf("%-56s %6s %6s  %-6s  %s\n", strName.c_str(), strRatio.c_str(),
                    Shown(goal, goal).c_str(), blMet ? "met" : "missed", strPeer.c_str());
    }

    std::map<std::string, double> m_ratios;
    std::set<std::string> m_failed;
    int m_shown = 0;
    int m_met = 0;
};

}  // namespace

void AddRow(const Row &row) {
    Rows()[row.strName] = row;
    // The registry of Google Benchmark owns it.
    benchmark::internal::RegisterBenchmarkInternal(new Contest(row));
}

void Require(bool blHolds, const std::string &strReason) {
    if (!blHolds) {
        throw std::runtime_error(strReason);
    }
}

double Seconds(const std::function<bool()> &operation) {
    const auto begin = std::chrono::steady_clock::now();
    const bool blDone = operation();
    const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - begin;
    return blDone ? taken.count() : -1;
}

int Run(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 2;
    }
    Table table;
    benchmark::RunSpecifiedBenchmarks(&table);
    return table.Conclude() ? 0 : 1;
}

}  // namespace bench
