#ifndef VOK_BENCH_REPORT_H
#define VOK_BENCH_REPORT_H

// What a run measured, and the two forms it leaves: a table for a person and
// a JSON file for the chart (and for comparing runs).

#include <cstddef>
#include <cstdio>
#include <string>
#include <vector>

#include "ways.h"

namespace vok {
namespace bench {

// Times of one cell (operation x way), in microseconds, from every round.
struct Cell {
    std::vector<double> us;
    std::string failure;  // why the cell stopped, if it did
};

struct Summary {
    size_t n = 0;
    double p10 = 0, p25 = 0, median = 0, p75 = 0, p90 = 0;
};

Summary summarize(std::vector<double> us);

struct OperationResults {
    const Operation* op;
    std::vector<Cell> ways;  // in the order of Results::wayNames
};

struct FloorResults {
    size_t bytes;
    Cell cell;
};

struct Memory {
    bool measured = false;
    size_t smallCalls = 0;
    std::vector<long> rssDuringSmallKiB;  // before the first call, then every tenth of them
    size_t bigDigestBytes = 0;
    long rssBeforeBigKiB = 0, rssPeakDuringBigKiB = 0, rssAfterBigKiB = 0;
    std::string failure;
};

struct Load {
    double loadStart[3] = {0, 0, 0}, loadEnd[3] = {0, 0, 0};
    double busyPercent = 0;  // of every core, all processes, over the timed rounds
    int cores = 0;
    double seconds = 0;
};

struct Results {
    std::vector<std::string> wayNames;
    std::vector<OperationResults> operations;
    std::vector<FloorResults> floors;
    Memory memory;
    Load load;
    int rounds = 0;
    double budgetMs = 0;
};

void printTable(const Results& results, std::FILE* out);
bool writeJson(const Results& results, const std::string& path);

}  // namespace bench
}  // namespace vok

#endif
