# Sums up the comparisons of one run or several: the medians of each, as a table if asked for, then
# how many goals are met, and those that are missed, the worst first.
# Usage: awk -v table=0|1 -f summary.awk results.tsv
BEGIN {
    FS = "\t"
}

{
    comparison = $1 FS $2 FS $3
    if (!(comparison in runs)) comparisons[++count] = comparison
    run = ++runs[comparison]
    job[comparison] = $1 FS $2
    name[comparison] = $1 ": " $2
    peer[comparison] = $3
    isLimit[comparison] = $4 == "limit"
    ours[comparison, run] = $5
    theirs[comparison, run] = $6
    ratios[comparison, run] = $7
    goal[comparison] = $9
}

END {
    for (i = 1; i <= count; ++i) {
        c = comparisons[i]
        ratio[c] = median(ratios, c)
        if (isLimit[c] || ratio[c] == 0) continue
        if (!(job[c] in fastest) || ratio[c] > ratio[fastest[job[c]]]) fastest[job[c]] = c
    }
    if (table) header()
    for (i = 1; i <= count; ++i) {
        c = comparisons[i]
        if (!isLimit[c] && ratio[c] > 0 && fastest[job[c]] != c) continue
        if (ratio[c] == 0) {
            ++skipped
        } else if (goal[c] > 0) {
            ++goals
            if (verdict(c) == "MISSED") missed[++misses] = c
        }
        if (table && ratio[c] > 0) row(c)
    }
    total()
}

# Of the runs of a comparison.
function median(values, c,    sorted, n, i, j, value) {
    n = runs[c]
    for (i = 1; i <= n; ++i) {
        value = values[c, i]
        for (j = i - 1; j > 0 && sorted[j] > value; --j) sorted[j + 1] = sorted[j]
        sorted[j + 1] = value
    }
    return n % 2 ? sorted[(n + 1) / 2] : (sorted[n / 2] + sorted[n / 2 + 1]) / 2
}

function verdict(c) {
    if (goal[c] == 0) return ""
    return ratio[c] <= goal[c] ? "met" : ratio[c] <= 1.1 * goal[c] ? "near" : "MISSED"
}

function duration(ns) {
    if (ns < 1000) return number(ns) " ns"
    if (ns < 1000000) return number(ns / 1000) " us"
    return number(ns / 1000000) " ms"
}

function number(value) {
    return sprintf(value < 10 ? "%.2f" : value < 100 ? "%.1f" : "%.0f", value)
}

function header() {
    printf "\n| %-52s | %9s | %-26s | %9s | %6s | %5s | %-6s |\n", "work", "ours", "peer or limit",
        "theirs", "ratio", "goal", ""
    print "|:-----------------------------------------------------|----------:" \
        "|:---------------------------|----------:|-------:|------:|:-------|"
}

function row(c) {
    printf "| %-52s | %9s | %-26s | %9s | %6.2f | %5s | %-6s |\n", name[c],
        duration(median(ours, c)), peer[c] (isLimit[c] ? " (limit)" : ""),
        duration(median(theirs, c)), ratio[c],
        (goal[c] > 0 ? sprintf("%.2f", goal[c]) : "-"), verdict(c)
}

function total(    i, j, c) {
    for (i = 2; i <= misses; ++i) {
        c = missed[i]
        for (j = i - 1; j > 0 && excess(missed[j]) < excess(c); --j) missed[j + 1] = missed[j]
        missed[j + 1] = c
    }
    printf "\n%d of %d goals met (near ones included)", goals - misses, goals
    printf "%s\n", (misses ? "; missed, worst first:" : "")
    for (i = 1; i <= misses; ++i) {
        c = missed[i]
        printf "- %s, against %s: %.2f instead of %.2f\n", name[c], peer[c], ratio[c], goal[c]
    }
    if (skipped) printf "%d comparisons skipped, for want of the peer\n", skipped
}

function excess(c) {
    return ratio[c] / goal[c]
}
