#!/bin/bash
# A real spooler on the serve mode: a private cupsd (configuration, spool,
# socket and logs in a temporary directory, listening on a local socket only)
# with a raw queue on the print channel through CUPS's serial backend. Five
# jobs queued at once arrive at the Java side as five jobs, byte-exact, in order.
# usage: cups.sh USBADAPTER-SIM      (exit 77: cupsd cannot run here)
sim=$1
skip() {
    echo "SKIP: $*"
    exit 77
}
cupsd=$(command -v cupsd || echo /usr/sbin/cupsd)
[ -x "$cupsd" ] || skip "no cupsd (Debian package cups)"
command -v lp >/dev/null && command -v lpadmin >/dev/null || skip "no lp/lpadmin (cups-client)"
[ -e /usr/lib/cups/backend/serial ] || skip "no serial backend"
[ "$(id -u)" -eq 0 ] || skip "cupsd runs its serial backend as root only: not root"

name=cups
cups=
on_fail() {
    tail -n 30 "$dir/log/error_log" 2>/dev/null
    [ -n "$cups" ] && kill -TERM "$cups" 2>/dev/null
}
. "$(dirname "$0")/common.sh"
chmod 755 "$dir"
serve "$dir/out"

mkdir -p "$dir/spool" "$dir/tmp" "$dir/cache" "$dir/state" "$dir/log" "$dir/etc/ppd"
sock=$dir/cups.sock
cat >"$dir/etc/cupsd.conf" <<CONF
Listen $sock
Browsing No
WebInterface No
LogLevel debug
MaxJobs 0
PreserveJobFiles No
<Policy default>
  <Limit All>
    Order allow,deny
    Allow all
  </Limit>
</Policy>
<Location />
  Order allow,deny
  Allow all
</Location>
CONF
cat >"$dir/etc/cups-files.conf" <<CONF
ServerRoot $dir/etc
RequestRoot $dir/spool
TempDir $dir/tmp
CacheDir $dir/cache
StateDir $dir/state
AccessLog $dir/log/access_log
ErrorLog $dir/log/error_log
PageLog $dir/log/page_log
Sandboxing Relaxed
CONF
"$cupsd" -f -c "$dir/etc/cupsd.conf" -s "$dir/etc/cups-files.conf" >"$dir/cupsd.txt" 2>&1 &
cups=$!
export CUPS_SERVER=$sock
i=0
until [ -S "$sock" ] && lpstat -r 2>/dev/null | grep -q "is running"; do
    i=$((i + 1))
    if [ $i -ge 200 ] || ! kill -0 "$cups" 2>/dev/null; then
        kill -TERM "$pid" 2>/dev/null
        skip "cupsd does not start here: $(cat "$dir/cupsd.txt"; tail -n 5 "$dir/log/error_log" 2>/dev/null)"
    fi
    sleep 0.05
done

uri="serial:$dir/out/prn?baud=115200+bits=8+parity=none+flow=none"
lpadmin -p sim -E -v "$uri" >"$dir/lpadmin.txt" 2>&1 || fail "lpadmin: $(cat "$dir/lpadmin.txt")"
# Five jobs queued at once; plain bytes (no UEL), so only the closes between
# the backend's runs separate them.
for i in 1 2 3 4 5; do
    head -c $((20000 + i * 3000)) /dev/urandom | tr -d '\033' >"$dir/job$i"
    lp -d sim -o raw -t "job$i" "$dir/job$i" >>"$dir/lp.txt" 2>&1 || fail "lp: $(cat "$dir/lp.txt")"
done
until_lines 5 '"event":"job-end"' "$dir/out/journal.jsonl"
queue_empty() { [ -z "$(lpstat -o 2>/dev/null)" ]; }
wait_for 200 "CUPS still holds jobs" queue_empty
for i in 1 2 3 4 5; do
    cmp -s "$dir/job$i" "$dir/out/$(printf 'job-%03d.prn' "$i")" || fail "job $i differs from what was queued"
done
[ "$(grep -c '"event":"job-end"' "$dir/out/journal.jsonl")" -eq 5 ] || fail "not 5 jobs at the Java side"
grep -q "Unable to open serial port" "$dir/log/error_log" && fail "the backend found no device"
kill -TERM "$cups" && wait "$cups"
stop "$dir/out"
pass
