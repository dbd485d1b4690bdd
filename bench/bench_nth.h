// The shape shared by the benchmarks that time the n-th creation of an object (a LUN, a
// target, a snapshot) against the first: each timed creation is recorded, the median of
// each n is kept, and the ratios to the first are printed with the bound of the largest n.
#ifndef ORLO_BENCH_BENCH_NTH_H
#define ORLO_BENCH_BENCH_NTH_H

#include <benchmark/benchmark.h>
#include <time.h>

#include <algorithm>
#include <cstdio>
#include <map>
#include <vector>

namespace orlobench {

inline double Now() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

// Medians of the timed creations, by n.
class NthMedians {
  public:
    // Times one creation (create returns true on success) into the state and the samples.
    template <typename Create>
    bool Time(benchmark::State &state, std::vector<double> *samples, Create create) {
        const double start = Now();
        const bool ok = create();
        const double elapsed = Now() - start;
        state.SetIterationTime(elapsed);
        samples->push_back(elapsed);
        return ok;
    }
    void Keep(int n, std::vector<double> samples) {
        if (samples.empty()) return;
        std::sort(samples.begin(), samples.end());
        medians_[n] = samples[samples.size() / 2];
    }
    // "median time to <what>:" and a line per n, the largest n judged against bound x the 1st.
    void Print(const char *what, int largest, double bound) const {
        auto first = medians_.find(1);
        if (first == medians_.end()) return;
        printf("\nmedian time to %s:\n", what);
        for (const auto &m : medians_) {
            const double ratio = m.second / first->second;
            printf("  n=%4d  %8.3f ms  %5.2f x the 1st%s\n", m.first, m.second * 1e3, ratio,
                   m.first == largest ? (ratio <= bound ? "  (within bound)" : "  (above bound)") : "");
        }
        printf("  bound: the %d-th at most %.1f x the 1st\n", largest, bound);
    }

  private:
    std::map<int, double> medians_;
};

}  // namespace orlobench

#endif
