# Start-up shared by the e2e scripts (sourced by bash): a work directory kept on
# failure, bounded waits, and the simulator in the background.
# Before sourcing: name=WORD (part of the directory name); optional hook
# on_fail (called before a failure exits).
set -u
dir=$(mktemp -d "/tmp/usbadapter-e2e-$name-XXXXXX")
pid=
fail() {
    echo "FAIL: $*"
    declare -F on_fail >/dev/null && on_fail
    [ -n "$pid" ] && kill -TERM "$pid" 2>/dev/null
    echo "(files kept in $dir)"
    exit 1
}
# wait_for TRIES WHY CMD...: runs CMD every 50 ms until it succeeds; fails
# with WHY after TRIES tries.
wait_for() {
    local tries=$1 why=$2 i=0
    shift 2
    until "$@"; do
        i=$((i + 1))
        [ $i -lt "$tries" ] || fail "$why"
        sleep 0.05
    done
}
# until_lines N PATTERN FILE: waits (bounded) for N lines matching PATTERN.
has_lines() { [ "$(grep -c "$2" "$3" 2>/dev/null)" -ge "$1" ]; }
until_lines() { wait_for 1200 "fewer than $1 lines of $2 in $3" has_lines "$@"; }
# until_link PATH WHAT: waits (bounded) for the simulator's link PATH while it runs.
has_link() { [ -L "$1" ] || { kill -0 "$pid" 2>/dev/null || fail "the simulator ended before making $2"; false; }; }
until_link() { wait_for 600 "no $2 at $1" has_link "$@"; }
# sim_bg OUT ARGS...: the simulator in the background (pid), output in OUT.txt.
sim_bg() {
    local out=$1
    shift
    "$sim" "$@" --out "$out" --timeout 8000 >"$out.txt" 2>&1 &
    pid=$!
}
# serve OUT: a serve session in the background, its print path at OUT/prn.
serve() {
    sim_bg "$1" serve
    until_link "$1/prn" "print channel"
}
# reap OUT: waits for the simulator, shows its output (JNI complaints in it
# fail the test) and wants status 0.
reap() {
    wait "$pid"
    local status=$?
    pid=
    cat "$1.txt"
    [ $status -eq 0 ] || fail "the simulator ended with status $status"
}
# stop OUT: SIGTERM to the session, then reap OUT.
stop() {
    kill -TERM "$pid"
    reap "$1"
}
# pass: removes the work directory.
pass() {
    rm -rf "$dir"
    echo "PASS"
}
