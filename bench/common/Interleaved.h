// Figures side by side on a shared, busy machine: every contender runs a short
// block of operations in turn, round after round, and each keeps the median of
// its blocks. Drift in the machine (other processes, frequency) then touches
// every contender alike, and a block that lost the processor midway is an
// outlier the median ignores.
#pragma once

#include <algorithm>
#include <chrono>
#include <functional>
#include <vector>

namespace bench {

struct Contender {
    std::function<void(int count)> block;  // runs the operation `count` times
    std::vector<double> blockNs;           // ns per operation, one entry per block

    double medianNs() const {
        std::vector<double> sorted = blockNs;
        std::sort(sorted.begin(), sorted.end());
        return sorted.empty() ? 0 : sorted[sorted.size() / 2];
    }
};

// Runs `rounds` rounds of one block of `perBlock` operations per contender,
// starting each round with a different contender, after one unrecorded round
// of warm-up.
inline void interleave(std::vector<Contender*> contenders, int rounds, int perBlock) {
    using Clock = std::chrono::steady_clock;
    for (int round = -1; round < rounds; ++round) {
        for (size_t k = 0; k < contenders.size(); ++k) {
            Contender& c = *contenders[(size_t(round + 1) + k) % contenders.size()];
            const Clock::time_point start = Clock::now();
            c.block(perBlock);
            const std::chrono::duration<double, std::nano> spent = Clock::now() - start;
            if (round >= 0) c.blockNs.push_back(spent.count() / perBlock);
        }
    }
}

}  // namespace bench
