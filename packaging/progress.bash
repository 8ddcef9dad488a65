# Sourced by dev and packaging/build: runs commands quietly and shows their progress on a terminal.

# shown_before: a prefix for each line shown, which says what is being done.

# logged LOG COMMAND...: logs the output and shows its latest line on a terminal.
logged() {
    local log=$1
    shift
    if is_shown; then
        "$@" 2>&1 </dev/null | tee -- "$log" | show_latest
    else
        "$@" >"$log" 2>&1 </dev/null
    fi
}

is_shown() { [[ -t 2 && ${TERM:-dumb} != dumb ]]; }

# Shows each line of standard input in place of the previous one.
show_latest() {
    local line
    while IFS= read -r line; do
        show_line "$line"
    done
    show_line
}

# show_line [LINE]: in place of the previous one.
show_line() {
    local width line=${1:+${shown_before-}$1}
    width=$(stty size <&2 | cut -d' ' -f2)
    ((width > 1)) || width=80
    printf '\r\033[K%s' "${line:0:width-1}" >&2
}
