# edges.awk: what a libFuzzer log says of new code, in one line. Edges of the program (cov) are what
# counts: features (ft), which tell how often an edge was passed, go on growing for ever. Dry means
# that the last new edge came in the first half of the runs, and that there were enough of them
# (-v enough=N) for the second half to mean something. Needs a log that was ended by libFuzzer.
function after(word) {
    match($0, word " *[0-9]+")
    return substr($0, RSTART + length(word), RLENGTH - length(word)) + 0
}
/^#[0-9]+\t/ && / cov: / {
    cov = after("cov:")
    if (!started || cov > best) {
        best = cov
        at = after("#")
    }
    # Until the inputs there were have been read, nothing is new.
    if (!started && $2 == "INITED") {
        started = 1
        first = cov
        loaded = at
    }
}
/^stat::number_of_executed_units:/ { runs = after("units:") - loaded }
END {
    if (!started || runs <= 0) {
        print "no runs"
        exit 1
    }
    at -= loaded
    printf "%d edges", best
    if (best == first) {
        printf ", none of them new"
    } else {
        printf ", %d of them new, the last at run %d", best - first, at
    }
    if (runs < enough) {
        printf "; %d runs would be enough to say whether it is dry\n", enough
    } else {
        printf 2 * at < runs ? "; dry\n" : "; not dry\n"
    }
}
