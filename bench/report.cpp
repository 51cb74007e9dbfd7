#include "report.h"

#include <algorithm>
#include <cmath>
#include <fstream>
#include <sstream>

namespace vok {
namespace bench {

namespace {

const char* const kFloorKeys[] = {"pingpong32", "pingpong4k", "pingpong1m"};

double at(const std::vector<double>& sorted, double q) {
    const double pos = q * static_cast<double>(sorted.size() - 1);
    const size_t lo = static_cast<size_t>(pos);
    const size_t hi = std::min(lo + 1, sorted.size() - 1);
    return sorted[lo] + (sorted[hi] - sorted[lo]) * (pos - static_cast<double>(lo));
}

std::string bytesText(size_t bytes) {
    if (bytes >= 1024 * 1024) return std::to_string(bytes / (1024 * 1024)) + " MiB";
    if (bytes >= 1024) return std::to_string(bytes / 1024) + " KiB";
    return std::to_string(bytes) + " B";
}

double mbPerSecond(size_t bytes, double us) { return us > 0 ? bytes / us : 0; }  // 1e6 B/s

// "38.1 µs ±4%", with MB/s where a payload of 4 KiB or more crosses.
std::string cellText(const Cell& cell, size_t bytes) {
    if (!cell.failure.empty()) return "failed: " + cell.failure;
    const Summary s = summarize(cell.us);
    if (s.n == 0) return "-";
    char text[64];
    const double spread = s.median > 0 ? 50 * (s.p75 - s.p25) / s.median : 0;
    if (s.median < 1000)
        std::snprintf(text, sizeof text, "%.1f µs ±%.0f%%", s.median, spread);
    else
        std::snprintf(text, sizeof text, "%.2f ms ±%.0f%%", s.median / 1000, spread);
    std::string result = text;
    if (bytes >= 4096) {
        std::snprintf(text, sizeof text, " %.0f MB/s", mbPerSecond(bytes, s.median));
        result += text;
    }
    return result;
}

const FloorResults* floorFor(const Results& r, size_t bytes) {
    for (const FloorResults& f : r.floors)
        if (f.bytes == bytes) return &f;
    return nullptr;
}

const Cell* wayCell(const Results& r, const OperationResults& o, const std::string& name) {
    for (size_t i = 0; i < r.wayNames.size() && i < o.ways.size(); ++i)
        if (r.wayNames[i] == name) return &o.ways[i];
    return nullptr;
}

double medianOf(const Cell* cell) {
    if (cell == nullptr || !cell->failure.empty() || cell->us.empty()) return 0;
    return summarize(cell->us).median;
}

// The proxy's time over the other's; 0 when either is missing.
double ratio(double proxy, double other) { return proxy > 0 && other > 0 ? proxy / other : 0; }

struct Ratios {
    double p11kit = 0, floor = 0;
    bool hasGoal = false, met = true;
};

Ratios ratiosOf(const Results& r, const OperationResults& o) {
    Ratios q;
    const double proxy = medianOf(wayCell(r, o, "proxy"));
    q.p11kit = ratio(proxy, medianOf(wayCell(r, o, "p11-kit")));
    const FloorResults* f = floorFor(r, o.op->floorBytes);
    q.floor = ratio(proxy, f ? medianOf(&f->cell) : 0);
    if (o.op->p11kitGoal > 0) {
        q.hasGoal = true;
        q.met = q.met && q.p11kit > 0 && q.p11kit <= o.op->p11kitGoal;
    }
    if (o.op->floorGoal > 0) {
        q.hasGoal = true;
        q.met = q.met && q.floor > 0 && q.floor <= o.op->floorGoal;
    }
    return q;
}

std::string goalText(const Operation& op) {
    char text[64] = "";
    if (op.p11kitGoal > 0 && op.p11kitGoal < 0.81)
        std::snprintf(text, sizeof text, "≤%.1f p11", op.p11kitGoal);
    else if (op.p11kitGoal > 0)
        std::snprintf(text, sizeof text, "≥%.1fx MB/s", 1 / op.p11kitGoal);
    std::string result = text;
    if (op.floorGoal > 0) {
        std::snprintf(text, sizeof text, " ≤%.1f floor", op.floorGoal);
        result += text;
    }
    return result;
}

std::string ratioText(double value) {
    if (value <= 0) return "-";
    char text[16];
    std::snprintf(text, sizeof text, "%.2f", value);
    return text;
}

// Pads to `width` display columns (µ, ±, ≤ and ≥ are one column each).
std::string padded(const std::string& text, size_t width) {
    size_t columns = 0;
    for (unsigned char c : text)
        if ((c & 0xc0) != 0x80) ++columns;
    return text + std::string(columns < width ? width - columns : 1, ' ');
}

std::string quoted(const std::string& text) {
    std::string result = "\"";
    for (char c : text) {
        if (c == '"' || c == '\\') result += '\\';
        result += static_cast<unsigned char>(c) < 0x20 ? ' ' : c;
    }
    return result + '"';
}

void jsonSummary(std::ostream& out, const Cell& cell, size_t bytes) {
    if (!cell.failure.empty()) {
        out << "{\"failed\": " << quoted(cell.failure) << "}";
        return;
    }
    const Summary s = summarize(cell.us);
    out << "{\"n\": " << s.n << ", \"median_us\": " << s.median << ", \"p10_us\": " << s.p10
        << ", \"p25_us\": " << s.p25 << ", \"p75_us\": " << s.p75 << ", \"p90_us\": " << s.p90;
    if (bytes > 0) out << ", \"mb_per_s\": " << mbPerSecond(bytes, s.median);
    out << "}";
}

const char* floorKey(size_t bytes) {
    return bytes >= 1024 * 1024 ? kFloorKeys[2] : bytes >= 4096 ? kFloorKeys[1] : kFloorKeys[0];
}

}  // namespace

Summary summarize(std::vector<double> us) {
    Summary s;
    s.n = us.size();
    if (us.empty()) return s;
    std::sort(us.begin(), us.end());
    s.p10 = at(us, 0.10);
    s.p25 = at(us, 0.25);
    s.median = at(us, 0.50);
    s.p75 = at(us, 0.75);
    s.p90 = at(us, 0.90);
    return s;
}

void printTable(const Results& r, std::FILE* out) {
    const size_t kName = 30, kCell = 27, kRatio = 9;
    std::string line = padded("operation", kName);
    for (const std::string& way : r.wayNames) line += padded(way, kCell);
    line += padded("floor", kCell) + padded("÷p11-kit", kRatio) + padded("÷floor", kRatio) + "goal";
    std::fprintf(out, "%s\n", line.c_str());
    for (const OperationResults& o : r.operations) {
        line = padded(o.op->name, kName);
        for (const Cell& cell : o.ways) line += padded(cellText(cell, o.op->bytes), kCell);
        const FloorResults* f = floorFor(r, o.op->floorBytes);
        line += padded(f ? bytesText(f->bytes) + ": " + cellText(f->cell, 0) : "-", kCell);
        const Ratios q = ratiosOf(r, o);
        line += padded(ratioText(q.p11kit), kRatio) + padded(ratioText(q.floor), kRatio);
        if (q.hasGoal) line += goalText(*o.op) + (q.met ? "  met" : "  NOT met");
        std::fprintf(out, "%s\n", line.c_str());
    }
    for (const FloorResults& f : r.floors) {
        line = padded("ping-pong " + bytesText(f.bytes) + " + 32 B back", kName) +
               cellText(f.cell, f.bytes);
        std::fprintf(out, "%s\n", line.c_str());
    }
    std::fprintf(out,
                 "cells: median ±half the interquartile range over %d interleaved rounds; "
                 "÷: the proxy's median time over the other's\n",
                 r.rounds);
    std::fprintf(out,
                 "load: %d cores, load average %.2f at the start and %.2f at the end, "
                 "cores %.0f%% busy (all processes) over %.0f s\n",
                 r.load.cores, r.load.loadStart[0], r.load.loadEnd[0], r.load.busyPercent,
                 r.load.seconds);
    const Memory& m = r.memory;
    if (!m.failure.empty()) {
        std::fprintf(out, "service memory: not measured (%s)\n", m.failure.c_str());
    } else if (m.measured && !m.rssDuringSmallKiB.empty()) {
        std::fprintf(out,
                     "service resident: %ld KiB before %zu small calls, %ld KiB after (%+ld); "
                     "C_Digest of %zu MiB: %ld KiB before, %ld KiB at its peak, %ld KiB after "
                     "(%+ld)\n",
                     m.rssDuringSmallKiB.front(), m.smallCalls, m.rssDuringSmallKiB.back(),
                     m.rssDuringSmallKiB.back() - m.rssDuringSmallKiB.front(),
                     m.bigDigestBytes >> 20, m.rssBeforeBigKiB, m.rssPeakDuringBigKiB,
                     m.rssAfterBigKiB, m.rssAfterBigKiB - m.rssBeforeBigKiB);
    }
}

bool writeJson(const Results& r, const std::string& path) {
    std::ostringstream out;
    out << "{\n  \"ways\": [";
    for (size_t i = 0; i < r.wayNames.size(); ++i)
        out << (i ? ", " : "") << '"' << r.wayNames[i] << '"';
    out << "],\n  \"rounds\": " << r.rounds << ",\n  \"budget_ms_per_cell\": " << r.budgetMs
        << ",\n  \"load\": {\"cores\": " << r.load.cores << ", \"loadavg_start\": ["
        << r.load.loadStart[0] << ", " << r.load.loadStart[1] << ", " << r.load.loadStart[2]
        << "], \"loadavg_end\": [" << r.load.loadEnd[0] << ", " << r.load.loadEnd[1] << ", "
        << r.load.loadEnd[2] << "], \"busy_percent\": " << r.load.busyPercent
        << ", \"seconds\": " << r.load.seconds << "},\n  \"operations\": [";
    for (size_t i = 0; i < r.operations.size(); ++i) {
        const OperationResults& o = r.operations[i];
        const Ratios q = ratiosOf(r, o);
        out << (i ? ",\n" : "\n") << "    {\"key\": \"" << o.op->key << "\", \"name\": \""
            << o.op->name << "\", \"bytes\": " << o.op->bytes << ", \"floor\": \""
            << floorKey(o.op->floorBytes) << "\", \"ways\": {";
        for (size_t w = 0; w < o.ways.size(); ++w) {
            out << (w ? ", " : "") << '"' << r.wayNames[w] << "\": ";
            jsonSummary(out, o.ways[w], o.op->bytes);
        }
        out << "}, \"proxy_over_p11kit\": " << q.p11kit << ", \"proxy_over_floor\": " << q.floor
            << ", \"goal_over_p11kit\": " << o.op->p11kitGoal
            << ", \"goal_over_floor\": " << o.op->floorGoal
            << ", \"goal_met\": " << (q.hasGoal ? (q.met ? "true" : "false") : "null") << "}";
    }
    out << "\n  ],\n  \"floors\": [";
    for (size_t i = 0; i < r.floors.size(); ++i) {
        out << (i ? ",\n" : "\n") << "    {\"key\": \"" << floorKey(r.floors[i].bytes)
            << "\", \"bytes\": " << r.floors[i].bytes << ", \"time\": ";
        jsonSummary(out, r.floors[i].cell, r.floors[i].bytes);
        out << "}";
    }
    const Memory& m = r.memory;
    out << "\n  ],\n  \"memory\": {\"measured\": " << (m.measured ? "true" : "false")
        << ", \"small_calls\": " << m.smallCalls << ", \"rss_kib_during_small_calls\": [";
    for (size_t i = 0; i < m.rssDuringSmallKiB.size(); ++i)
        out << (i ? ", " : "") << m.rssDuringSmallKiB[i];
    out << "], \"big_digest_bytes\": " << m.bigDigestBytes
        << ", \"rss_kib_before_big\": " << m.rssBeforeBigKiB
        << ", \"rss_kib_peak_during_big\": " << m.rssPeakDuringBigKiB
        << ", \"rss_kib_after_big\": " << m.rssAfterBigKiB << ", \"failure\": " << quoted(m.failure)
        << "}\n}\n";
    std::ofstream file(path);
    file << out.str();
    return static_cast<bool>(file);
}

}  // namespace bench
}  // namespace vok
