// Runs and compares candidates. Read measure.h first.
#include "measure.h"

#include "base/count.h"

#include <algorithm>
#include <array>
#include <benchmark/benchmark.h>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <stdexcept>

namespace {

// Carries out a task once. Calls `request_done(i)` after each request.
template <typename Done>
void carry_out(const task &work, const candidate &worker, std::uint8_t *buffer, Done request_done)
{
    for (std::size_t i = 0; i < work.requests.size(); ++i) {
        worker.move(work.requests[i], buffer);
        request_done(i);
    }
}

// Bytes that a request reads, or samples that it writes.
std::size_t bytes_of(const task &work, const request &asked)
{
    return asked.nlines == 0 || asked.nsamps == 0
               ? work.buffer_size
               : img_count(asked.nlines) * img_count(asked.nsamps);
}

std::vector<std::uint8_t> written_samples(const candidate &worker)
{
    std::ifstream in(worker.written, std::ios::binary);
    in.seekg(static_cast<std::streamoff>(worker.skipped));
    std::vector<std::uint8_t> samples(std::istreambuf_iterator<char>(in), {});
    samples.resize(std::min(samples.size(), worker.samples));
    return samples;
}

std::vector<std::uint8_t> content_to_write(const task &work)
{
    std::vector<std::uint8_t> content(work.buffer_size);
    for (std::size_t i = 0; i < content.size(); ++i)
        content[i] = static_cast<std::uint8_t>(i * 7 + i / 251);
    return content;
}

// The result of a task: the bytes that all requests read, or the samples of the file written.
std::vector<std::uint8_t> result_of(const task &work, const candidate &worker)
{
    std::vector<std::uint8_t> buffer = content_to_write(work), all;
    if (worker.begin) worker.begin();
    carry_out(work, worker, buffer.data(), [&](std::size_t i) {
        if (worker.written.empty())
            all.insert(all.end(), buffer.begin(),
                       buffer.begin() +
                           static_cast<std::ptrdiff_t>(bytes_of(work, work.requests[i])));
    });
    if (worker.end) worker.end();
    return worker.written.empty() ? all : written_samples(worker);
}

// A buffer for the largest request, at the start of a page. All candidates share it, because the
// speed of a copy depends on its alignment.
std::uint8_t *shared_buffer(const std::vector<task> &tasks)
{
    constexpr std::size_t page = 4096;
    static std::vector<std::uint8_t> room;
    const auto largest = std::ranges::max_element(tasks, {}, &task::buffer_size);
    room = content_to_write(*largest);
    room.resize(room.size() + page);
    return room.data() + -reinterpret_cast<std::uintptr_t>(room.data()) % page;
}

void run(benchmark::State &state, const task &work, const candidate &worker, std::uint8_t *buffer)
{
    using clock = std::chrono::steady_clock;
    for ([[maybe_unused]] auto _ : state) {
        if (worker.begin) worker.begin();
        const auto start = clock::now();
        carry_out(work, worker, buffer, [](std::size_t) {});
        const std::chrono::duration<double> taken = clock::now() - start;
        state.SetIterationTime(taken.count() / static_cast<double>(work.requests.size()));
        if (worker.end) worker.end();
    }
}

// Keeps the medians, and prints nothing.
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

void print_row(const task &work, const medians &times)
{
    const auto time_of = [&](const std::string &name) {
        const auto found = times.find(work.name + "/" + name);
        return found != times.end() ? found->second : 0.0;
    };
    double limit = 0.0;
    for (const candidate &each : work.candidates) {
        const double time = time_of(each.name);
        if (each.is_limit && time != 0.0) limit = limit == 0.0 ? time : std::min(limit, time);
    }
    std::printf("%-4s%-29s", work.name.c_str(), work.title.c_str());
    for (const char *const name : columns) {
        if (time_of(name) != 0.0)
            std::printf("%9.2f", time_of(name));
        else
            std::printf("%9s", "-");
    }
    if (limit != 0.0)
        std::printf("%8.2f%8.2f\n", time_of("imgfile") / limit, work.goal);
    else
        std::printf("\n");
}

}  // namespace

bool agree(const std::vector<task> &tasks)
{
    bool all_agree = true;
    for (const task &work : tasks) {
        const auto by_hand = std::ranges::find(work.candidates, true, &candidate::is_limit);
        const std::vector<std::uint8_t> expected = result_of(work, *by_hand);
        for (const candidate &each : work.candidates) {
            const std::vector<std::uint8_t> result = result_of(work, each);
            if (result == expected) continue;
            const auto where = std::ranges::mismatch(result, expected).in1 - result.begin();
            std::printf("%s: %s differs from %s, from byte %td of %zu (%zu) on\n",
                        work.name.c_str(), each.name.c_str(), by_hand->name.c_str(), where,
                        result.size(), expected.size());
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
    std::printf("%8s%8s\n", "ratio", "goal");
    for (const task &work : tasks) {
        benchmark::ClearRegisteredBenchmarks();
        for (const candidate &each : work.candidates)
            benchmark::RegisterBenchmark(
                (work.name + "/" + each.name).c_str(),
                [&work, &each, buffer](benchmark::State &state) { run(state, work, each, buffer); })
                ->Iterations(1)
                ->Repetitions(rounds)
                ->Unit(benchmark::kMicrosecond)
                ->UseManualTime();
        collector collecting(times);
        benchmark::RunSpecifiedBenchmarks(&collecting);  // candidates of one task take turns
        print_row(work, times);
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
