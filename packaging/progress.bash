# Sourced by dev and packaging/build: runs what nobody wants to read about, and shows on a terminal how far it is.

# shown_before: stands before each line that is shown, and says what is being done.

# logged LOG COMMAND...: what it prints goes to the log and, as long as it is the latest line, to a terminal.
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

# Shows each line of standard input in the place of the one before.
show_latest() {
    local line
    while IFS= read -r line; do
        show_line "$line"
    done
    show_line
}

# show_line [LINE]: in the place of the one before.
show_line() {
    local width line=${1:+${shown_before-}$1}
    width=$(stty size <&2 | cut -d' ' -f2)
    ((width > 1)) || width=80
    printf '\r\033[K%s' "${line:0:width-1}" >&2
}
