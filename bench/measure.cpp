#include "measure.h"

#include <algorithm>
#include <array>
#include <benchmark/benchmark.h>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <stdexcept>

namespace {

// Carries out a task once. `window_done(i)` follows each window.
template <typename Done>
void carry_out(const task &of, const candidate &by, std::uint8_t *buffer, Done window_done)
{
    for (std::size_t i = 0; i < of.windows.size(); ++i) {
        by.move(of.windows[i], buffer);
        window_done(i);
    }
}

// What a window reads, or the samples that it writes.
std::size_t bytes_of(const task &of, const window &at)
{
    return at.nlines == 0 || at.nsamps == 0
               ? of.buffer_size
               : static_cast<std::size_t>(at.nlines) * static_cast<std::size_t>(at.nsamps);
}

std::vector<std::uint8_t> samples_of(const candidate &by)
{
    std::ifstream in(by.written, std::ios::binary);
    in.seekg(static_cast<std::streamoff>(by.skipped));
    std::vector<std::uint8_t> samples(std::istreambuf_iterator<char>(in), {});
    samples.resize(std::min(samples.size(), by.samples));
    return samples;
}

std::vector<std::uint8_t> content_to_write(const task &of)
{
    std::vector<std::uint8_t> content(of.buffer_size);
    for (std::size_t i = 0; i < content.size(); ++i)
        content[i] = static_cast<std::uint8_t>(i * 7 + i / 251);
    return content;
}

// All that a task delivers: what its windows read, or the samples of the file that it writes.
std::vector<std::uint8_t> result_of(const task &of, const candidate &by)
{
    std::vector<std::uint8_t> buffer = content_to_write(of), all;
    if (by.begin) by.begin();
    carry_out(of, by, buffer.data(), [&](std::size_t i) {
        if (by.written.empty())
            all.insert(all.end(), buffer.begin(),
                       buffer.begin() + static_cast<std::ptrdiff_t>(bytes_of(of, of.windows[i])));
    });
    if (by.end) by.end();
    return by.written.empty() ? all : samples_of(by);
}

// Room for the largest window, on a whole page and the same for all: where the copies of one begin
// relative to what they copy would be its luck otherwise.
std::uint8_t *shared_buffer(const std::vector<task> &tasks)
{
    constexpr std::size_t page = 4096;
    static std::vector<std::uint8_t> room;
    const auto largest = std::ranges::max_element(tasks, {}, &task::buffer_size);
    room = content_to_write(*largest);
    room.resize(room.size() + page);
    return room.data() + -reinterpret_cast<std::uintptr_t>(room.data()) % page;
}

void run(benchmark::State &state, const task &of, const candidate &by, std::uint8_t *buffer)
{
    using clock = std::chrono::steady_clock;
    for ([[maybe_unused]] auto _ : state) {
        if (by.begin) by.begin();
        const auto start = clock::now();
        carry_out(of, by, buffer, [](std::size_t) {});
        const std::chrono::duration<double> taken = clock::now() - start;
        state.SetIterationTime(taken.count() / static_cast<double>(of.windows.size()));
        if (by.end) by.end();
    }
}

// Collects the medians instead of printing every repetition.
class collector : public benchmark::BenchmarkReporter {
public:
    explicit collector(medians &times) : m_times(times) {}
    bool ReportContext(const Context & /*context*/) override { return true; }
    void ReportRuns(const std::vector<Run> &runs) override
    {
        for (const Run &each : runs)
            if (each.aggregate_name == "median")
                m_times[each.run_name.function_name] = each.GetAdjustedRealTime();
    }

private:
    medians &m_times;
};

constexpr std::array columns{"imgfile", "plain", "mapped", "libtiff", "gdal"};

void print_row(const task &of, const medians &times)
{
    const auto time_of = [&](const std::string &name) {
        const auto found = times.find(of.name + "/" + name);
        return found != times.end() ? found->second : 0.0;
    };
    double limit = 0.0;
    for (const candidate &each : of.candidates) {
        const double time = time_of(each.name);
        if (each.is_limit && time != 0.0) limit = limit == 0.0 ? time : std::min(limit, time);
    }
    std::printf("%-4s%-29s", of.name.c_str(), of.title.c_str());
    for (const char *const name : columns) {
        if (time_of(name) != 0.0)
            std::printf("%9.2f", time_of(name));
        else
            std::printf("%9s", "-");
    }
    if (limit != 0.0)
        std::printf("%8.2f%8.2f\n", time_of("imgfile") / limit, of.to_reach);
    else
        std::printf("\n");
}

}  // namespace

bool agree(const std::vector<task> &tasks)
{
    bool all_agree = true;
    for (const task &of : tasks) {
        const auto by_hand = std::ranges::find(of.candidates, true, &candidate::is_limit);
        const std::vector<std::uint8_t> expected = result_of(of, *by_hand);
        for (const candidate &each : of.candidates) {
            const std::vector<std::uint8_t> result = result_of(of, each);
            if (result == expected) continue;
            const auto where = std::ranges::mismatch(result, expected).in1 - result.begin();
            std::printf("%s: %s differs from %s, from byte %td of %zu (%zu) on\n", of.name.c_str(),
                        each.name.c_str(), by_hand->name.c_str(), where, result.size(),
                        expected.size());
            all_agree = false;
        }
    }
    return all_agree;
}

medians measure(const std::vector<task> &tasks, int rounds)
{
    medians times;
    std::uint8_t *const buffer = shared_buffer(tasks);
    std::printf("%-33s", "microseconds per window");
    for (const char *const name : columns) std::printf("%9s", name);
    std::printf("%8s%8s\n", "ratio", "reach");
    for (const task &of : tasks) {
        benchmark::ClearRegisteredBenchmarks();
        for (const candidate &each : of.candidates)
            benchmark::RegisterBenchmark(
                (of.name + "/" + each.name).c_str(),
                [&of, &each, buffer](benchmark::State &state) { run(state, of, each, buffer); })
                ->Iterations(1)
                ->Repetitions(rounds)
                ->Unit(benchmark::kMicrosecond)
                ->UseManualTime();
        collector collecting(times);
        benchmark::RunSpecifiedBenchmarks(&collecting);  // only these take turns
        print_row(of, times);
        std::fflush(stdout);
    }
    return times;
}

medians measure_registered()
{
    medians times;
    collector collecting(times);
    benchmark::RunSpecifiedBenchmarks(&collecting);
    std::printf("%-44s%9s\n", "microseconds per window", "imgfile");
    for (const auto &[name, time] : times) std::printf("%-44s%9.2f\n", name.c_str(), time);
    return times;
}

void write_json(const std::string &path, const medians &times)
{
    std::ofstream out(path);
    const char *before = "{\n";
    for (const auto &[name, time] : times) {
        out << before << "  \"" << name << "\": " << time;
        before = ",\n";
    }
    out << "\n}\n";
    if (!out.flush()) throw std::runtime_error("cannot write " + path);
}
