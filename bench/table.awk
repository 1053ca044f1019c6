# Lays out the rows the benchmark programs print (bench/common/BenchRow.h) as
# one Markdown table, judging each target. Other lines pass through to
# standard error, so nothing a program says is lost.
BEGIN {
    FS = "\t"
    n = 0
    split("area|figure|value|unit|beside|beside value|ratio|target|met", head, "|")
    for (c = 1; c <= 9; c++) width[c] = length(head[c])
}

function number(v) {
    if (v == "-") return v
    v += 0
    if (v == int(v) && v < 100) return sprintf("%d", v)
    if (v >= 100) return sprintf("%.0f", v)
    return sprintf("%.1f", v)
}

function verdict(target, value, ratio) {
    if (target == "-") return "-"
    if (target ~ /^<=/) return ratio != "-" && ratio + 0 <= substr(target, 3) + 0 ? "yes" : "NO"
    if (target ~ /^>=/) return ratio != "-" && ratio + 0 >= substr(target, 3) + 0 ? "yes" : "NO"
    if (target ~ /^=/) return value + 0 == substr(target, 2) + 0 ? "yes" : "NO"
    return "?"
}

$1 == "row" && NF == 9 {
    n++
    cell[n, 1] = $2
    cell[n, 2] = $3
    cell[n, 3] = number($4)
    cell[n, 4] = $5
    cell[n, 5] = $6
    cell[n, 6] = number($7)
    cell[n, 7] = $8 == "-" ? "-" : $8 "x"
    cell[n, 8] = $9
    cell[n, 9] = verdict($9, $4, $8)
    for (c = 1; c <= 9; c++) if (length(cell[n, c]) > width[c]) width[c] = length(cell[n, c])
    next
}

{ print > "/dev/stderr" }

function line(values,    c, out) {
    out = "|"
    for (c = 1; c <= 9; c++) {
        if (c == 3 || c == 6 || c == 7) out = out sprintf(" %*s |", width[c], values[c])
        else out = out sprintf(" %-*s |", width[c], values[c])
    }
    print out
}

END {
    line(head)
    for (c = 1; c <= 9; c++) rule[c] = sprintf("%*s", width[c], "")
    for (c = 1; c <= 9; c++) gsub(/ /, "-", rule[c])
    line(rule)
    for (r = 1; r <= n; r++) {
        for (c = 1; c <= 9; c++) row[c] = cell[r, c]
        line(row)
    }
}
