// One line of the merged benchmark table, as every benchmark program prints it
// on standard output for bench/table.sh to lay out:
//   row <TAB> area <TAB> figure <TAB> value <TAB> unit <TAB> beside <TAB> beside value <TAB> ratio
//   <TAB> target
// Empty fields are "-". A target reads "<=1.50" or ">=0.90" and applies to the
// ratio, or "=0" and applies to the value.
#pragma once

#include <cstdio>
#include <string>

namespace bench {

struct Row {
    std::string area;
    std::string figure;
    double value = 0;
    std::string unit;
    std::string beside = "-";
    double besideValue = 0;
    std::string target = "-";
};

inline void printRow(const Row& r) {
    const bool compared = r.beside != "-" && r.besideValue > 0;
    char besideValue[32] = "-";
    char ratio[32] = "-";
    if (compared) {
        std::snprintf(besideValue, sizeof(besideValue), "%.6g", r.besideValue);
        std::snprintf(ratio, sizeof(ratio), "%.2f", r.value / r.besideValue);
    }
    std::printf("row\t%s\t%s\t%.6g\t%s\t%s\t%s\t%s\t%s\n", r.area.c_str(), r.figure.c_str(),
                r.value, r.unit.c_str(), r.beside.c_str(), besideValue, ratio, r.target.c_str());
    std::fflush(stdout);
}

}  // namespace bench
