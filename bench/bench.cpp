// The benchmark: the same PKCS#11 operations on one SoftHSM2 token, called
// directly in this process, through this proxy and through p11-kit's RPC,
// and the bare socket exchange as the floor, interleaved in rounds so that
// the machine's noise falls on every way alike. Then the service's resident
// memory over many small calls and one large digest. scripts/bench starts the
// service host and the p11-kit server and runs this; see it for the set-up.
//
//   vok_bench --proxy <libQuorvelPkcs11Wrapper.so> --server-id <id>
//             --direct-bridge <bridge copy> --p11kit-bridge <another bridge copy>
//             --softhsm <module> --p11kit-client <module> --pin <user PIN>
//             --service-pid <pid> --json <file>
//             [--rounds N] [--budget-ms M] [--small-calls N] [--big-mib N]
//             [--ops <key>,<key>...]    only these operations (see ways.cpp)
//
// Prints the table on standard output and writes the figures as JSON. Exit
// status 0 when every way could be set up and the run finished, whatever the
// figures; an operation that fails on one way is reported in its cell.

#include <sys/types.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <map>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>

#include "floor.h"
#include "report.h"
#include "ways.h"

namespace {

using namespace vok::bench;
using Clock = std::chrono::steady_clock;

struct Options {
    std::map<std::string, std::string> values;
    const std::string& operator[](const std::string& name) const {
        auto it = values.find(name);
        if (it == values.end()) throw std::runtime_error("missing --" + name);
        return it->second;
    }
    std::string text(const std::string& name, const std::string& fallback) const {
        auto it = values.find(name);
        return it == values.end() ? fallback : it->second;
    }
    long number(const std::string& name, long fallback) const {
        auto it = values.find(name);
        return it == values.end() ? fallback : std::stol(it->second);
    }
};

Options parse(int argc, char** argv) {
    Options o;
    for (int i = 1; i + 1 < argc; i += 2) {
        if (std::strncmp(argv[i], "--", 2) != 0)
            throw std::runtime_error(std::string("unexpected ") + argv[i]);
        o.values[argv[i] + 2] = argv[i + 1];
    }
    return o;
}

double microseconds(Clock::duration d) {
    return std::chrono::duration<double, std::micro>(d).count();
}

std::string rvText(CK_RV rv) {
    char text[32];
    std::snprintf(text, sizeof text, "0x%llx", static_cast<unsigned long long>(rv));
    return text;
}

// Calls one operation on one way until the budget is spent (at least three
// times, at most `maxCalls`), timing only the call itself.
void runCell(const Operation& op, Way& way, Scratch& scratch, Clock::duration budget,
             size_t maxCalls, Cell& cell) {
    if (!cell.failure.empty()) return;
    const Clock::time_point start = Clock::now();
    for (size_t n = 0; n < 3 || (n < maxCalls && Clock::now() - start < budget); ++n) {
        CK_RV rv = op.prepare(way, scratch);
        if (rv != CKR_OK) {
            cell.failure = rvText(rv) + " at Init";
            return;
        }
        const Clock::time_point t0 = Clock::now();
        rv = op.call(way, scratch);
        const Clock::time_point t1 = Clock::now();
        if (rv != CKR_OK) {
            cell.failure = rvText(rv);
            return;
        }
        cell.us.push_back(microseconds(t1 - t0));
    }
}

void runFloor(PingPong& pingPong, Clock::duration budget, size_t maxCalls, FloorResults& floor) {
    const Clock::time_point start = Clock::now();
    for (size_t n = 0; n < 3 || (n < maxCalls && Clock::now() - start < budget); ++n) {
        const Clock::time_point t0 = Clock::now();
        if (!pingPong.exchange(floor.bytes)) {
            floor.cell.failure = "the peer is gone";
            return;
        }
        floor.cell.us.push_back(microseconds(Clock::now() - t0));
    }
}

struct CpuTimes {
    unsigned long long busy = 0, total = 0;
};

CpuTimes cpuTimes() {
    std::ifstream stat("/proc/stat");
    std::string cpu;
    unsigned long long user, nice, system, idle, iowait, irq, softirq, steal;
    stat >> cpu >> user >> nice >> system >> idle >> iowait >> irq >> softirq >> steal;
    CpuTimes t;
    t.busy = user + nice + system + irq + softirq + steal;
    t.total = t.busy + idle + iowait;
    return t;
}

void loadAverage(double (&load)[3]) {
    std::ifstream file("/proc/loadavg");
    file >> load[0] >> load[1] >> load[2];
}

long residentKiB(const std::string& pid) {
    std::ifstream status("/proc/" + pid + "/status");
    std::string line;
    while (std::getline(status, line))
        if (line.rfind("VmRSS:", 0) == 0) return std::stol(line.substr(6));
    return -1;
}

// The service's resident size over `smallCalls` small calls through the
// proxy, then around one C_Digest of `bigBytes`, sampled while it runs.
Memory probeMemory(Way& proxy, Scratch& scratch, const std::string& servicePid, size_t smallCalls,
                   size_t bigBytes) {
    Memory m;
    m.smallCalls = smallCalls;
    m.bigDigestBytes = bigBytes;
    if (residentKiB(servicePid) < 0) {
        m.failure = "no process " + servicePid;
        return m;
    }
    const size_t step = std::max<size_t>(1, smallCalls / 10);
    m.rssDuringSmallKiB.push_back(residentKiB(servicePid));
    for (size_t i = 0; i < smallCalls; ++i) {
        const CK_RV rv = smallCall(proxy, scratch, i);
        if (rv != CKR_OK) {
            m.failure = "small call " + std::to_string(i) + ": " + rvText(rv);
            return m;
        }
        if ((i + 1) % step == 0) m.rssDuringSmallKiB.push_back(residentKiB(servicePid));
    }
    std::vector<CK_BYTE> big(bigBytes, 0x5a);
    m.rssBeforeBigKiB = residentKiB(servicePid);
    std::atomic<bool> done{false};
    std::atomic<long> peak{m.rssBeforeBigKiB};
    std::thread sampler([&] {
        while (!done) {
            peak = std::max(peak.load(), residentKiB(servicePid));
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    });
    const CK_RV rv = digestOf(proxy, big);
    done = true;
    sampler.join();
    m.rssPeakDuringBigKiB = peak;
    m.rssAfterBigKiB = residentKiB(servicePid);
    if (rv != CKR_OK) m.failure = "C_Digest of the large input: " + rvText(rv);
    m.measured = m.failure.empty();
    return m;
}

int run(PingPong& pingPong, const Options& o) {
    const std::string pin = o["pin"];
    Results results;
    results.wayNames = {"direct", "proxy", "p11-kit"};
    std::vector<Way> ways(3);
    for (size_t i = 0; i < ways.size(); ++i) ways[i].name = results.wayNames[i];

    ways[0].f = loadBridge(o["direct-bridge"], o["softhsm"]);
    std::unique_ptr<vok::demo::ProxyLibrary> proxyLibrary(
        new vok::demo::ProxyLibrary(o["proxy"], o["server-id"]));
    ways[1].f = proxyLibrary->functions();
    ways[2].f = loadBridge(o["p11kit-bridge"], o["p11kit-client"]);
    for (Way& way : ways) {
        try {
            prepareWay(way, pin);
        } catch (const std::exception& e) {
            throw std::runtime_error(way.name + ": " + e.what());
        }
    }

    // --ops getinfo,digest1m runs only those (for profiling one operation).
    const std::string only = "," + o.text("ops", "") + ",";
    std::vector<Operation> ops;
    for (const Operation& op : operations())
        if (only == ",," || only.find("," + std::string(op.key) + ",") != std::string::npos)
            ops.push_back(op);
    for (const Operation& op : ops) results.operations.push_back({&op, std::vector<Cell>(3)});
    for (size_t bytes : {size_t{32}, size_t{4096}, PingPong::kLargest})
        results.floors.push_back({bytes, Cell()});

    results.rounds = static_cast<int>(o.number("rounds", 30));
    results.budgetMs = static_cast<double>(o.number("budget-ms", 20));
    const auto budget = std::chrono::microseconds(static_cast<long>(results.budgetMs * 1000));
    const size_t maxCalls = 2000;
    Scratch scratch;

    // A warm-up round whose figures are dropped: the first calls fault pages
    // in and fill caches in every process involved.
    {
        std::vector<Cell> dropped(ops.size() * ways.size());
        for (size_t i = 0; i < ops.size(); ++i)
            for (size_t w = 0; w < ways.size(); ++w)
                runCell(ops[i], ways[w], scratch, budget / 4, 50, dropped[i * ways.size() + w]);
    }

    loadAverage(results.load.loadStart);
    const CpuTimes cpuStart = cpuTimes();
    const Clock::time_point runStart = Clock::now();
    for (int round = 0; round < results.rounds; ++round) {
        // Each round starts at another operation and way, and the floors are
        // spread among the operations.
        for (size_t k = 0; k < ops.size(); ++k) {
            const size_t i = (k + static_cast<size_t>(round)) % ops.size();
            for (size_t j = 0; j < ways.size(); ++j) {
                const size_t w = (j + static_cast<size_t>(round)) % ways.size();
                runCell(ops[i], ways[w], scratch, budget, maxCalls, results.operations[i].ways[w]);
            }
            if (k < results.floors.size())
                runFloor(pingPong, budget, maxCalls,
                         results.floors[(k + static_cast<size_t>(round)) % results.floors.size()]);
        }
    }
    const CpuTimes cpuEnd = cpuTimes();
    loadAverage(results.load.loadEnd);
    results.load.seconds = microseconds(Clock::now() - runStart) / 1e6;
    results.load.cores = static_cast<int>(std::thread::hardware_concurrency());
    if (cpuEnd.total > cpuStart.total)
        results.load.busyPercent = 100.0 * static_cast<double>(cpuEnd.busy - cpuStart.busy) /
                                   static_cast<double>(cpuEnd.total - cpuStart.total);

    results.memory = probeMemory(ways[1], scratch, o["service-pid"],
                                 static_cast<size_t>(o.number("small-calls", 100000)),
                                 static_cast<size_t>(o.number("big-mib", 64)) << 20);

    printTable(results, stdout);
    if (!writeJson(results, o["json"])) throw std::runtime_error("cannot write " + o["json"]);
    for (Way& way : ways) {
        way.session.reset();
        way.f->C_Finalize(nullptr);
    }
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    try {
        PingPong pingPong;  // first of all: the fork copies nothing else
        return run(pingPong, parse(argc, argv));
    } catch (const std::exception& e) {
        std::fprintf(stderr, "vok_bench: %s\n", e.what());
        return 1;
    }
}
