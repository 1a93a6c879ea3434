# Reads a line per run: "on" or "off", seconds to read, seconds to drop, KiB at the peak. Prints a table of
# the medians and a sentence. A difference counts if all runs of one side are below all runs of the other,
# there are two or more per side, and it does not round to 0 %.

{
    ++runs[$1]
    for (field = 2; field <= 4; ++field) { values[$1, field, runs[$1]] = $field }
}

END {
    printf "%-24s%14s%14s%9s\n", "", "pools on", "pools off", "ratio"
    row(2, "time to read and keep", "time to read")
    row(3, "time to drop", "time to drop")
    row(4, "peak memory, resident", "memory")
    if (better && worse) { verdict = "gain and lose" }
    else if (better) { verdict = "gain" }
    else if (worse) { verdict = "lose" }
    else { verdict = "neither gain nor lose" }
    printf "\nPools %s here: %s, %s and %s.\n", verdict, clause[2], clause[3], clause[4]
}

function row(field, name, short,    on, off, percent) {
    sort("on", field)
    sort("off", field)
    on = median("on", field)
    off = median("off", field)
    percent = off > 0 ? int(100 * on / off + 0.5) - 100 : 0
    printf "%-24s%14s%14s%9s\n", name, amount(on, off, field), amount(off, off, field),
        (off > 0 ? sprintf("%.2f", on / off) : "-")

    clause[field] = "about the same " short
    if (runs["on"] < 2) { return }
    if (percent < 0 && values["on", field, runs["on"]] < values["off", field, 1]) {
        clause[field] = -percent " % less " short
        better = 1
    } else if (percent > 0 && values["on", field, 1] > values["off", field, runs["off"]]) {
        clause[field] = percent " % more " short
        worse = 1
    }
}

function sort(side, field,    i, j, value) {
    for (i = 2; i <= runs[side]; ++i) {
        value = values[side, field, i]
        for (j = i - 1; j > 0 && values[side, field, j] > value; --j) {
            values[side, field, j + 1] = values[side, field, j]
        }
        values[side, field, j + 1] = value
    }
}

function median(side, field,    n) {
    n = runs[side]
    return (values[side, field, int((n + 1) / 2)] + values[side, field, int(n / 2) + 1]) / 2
}

# `value` in a unit that suits the size of `guide`.
function amount(value, guide, field) {
    if (field == 4) { return sprintf("%.1f MiB", value / 1024) }
    if (guide >= 1) { return sprintf("%.2f s", value) }
    if (guide >= 0.001) { return sprintf("%.2f ms", 1000 * value) }
    return sprintf("%.0f us", 1000000 * value)
}
