#!/usr/bin/env bash
# The console on a real kernel's HCI user channel, inside scripts/kernel-vm.sh:
# the simulated controller registers through /dev/vhci as an adapter, one
# console process takes it through every test mode, the probe meets each bind
# refusal, and a second console loses the adapter during a step. One line per
# check, then "N passed, N failed"; exit status 1 when any failed.
set -u
cd "$(dirname "$0")/../.." || exit 1
build=${HALVENOR_BUILD_DIR:?}
probe=$build/tests/hci_user_probe
scratch=$(mktemp -d)
passed=0 failed=0

check() {  # name, then the test as a command
    local name=$1
    shift
    if "$@"; then
        echo "pass: $name"; passed=$((passed + 1))
    else
        echo "FAIL: $name"; failed=$((failed + 1))
    fi
}
has() { grep -qF -- "$2" "$1" || { echo "  expected '$2' in:"; sed 's/^/  | /' "$1"; false; }; }
equals() { [ "$1" = "$2" ] || { echo "  expected '$2', got '$1'"; false; }; }

# 1. The simulator, with its reference transmitter, as adapter hciN.
exec 3< <(exec "$build/host/halvenor-sim" --vhci /dev/vhci --reftx 1 2>&1)
sim=$!
read -r -t 10 -u 3 line || line="(nothing within 10 s)"
if [[ $line =~ ^serving\ hci:([0-9]+)\ through\ /dev/vhci$ ]]; then
    index=${BASH_REMATCH[1]}
else
    echo "FAIL: halvenor-sim --vhci: $line"
    echo "0 passed, 1 failed"
    exit 1
fi
echo "pass: halvenor-sim registered hci$index"
passed=1

# 2. DUT on and off, a receiver test on every frequency and PHY with its count,
#    a transmitter test and the carrier, in one console (a JVM starts in about
#    3 s under emulation).
./halvenor --hci "hci:$index" demo >"$scratch/demo" 2>&1
status=$?
check "demo over hci:$index: exit status 0" equals "$status" 0
check "demo over hci:$index: every step ok, every receiver test PASS" has "$scratch/demo" "all 10 steps ok (6 PASS)"

# 3. What the kernel refuses, in the console's words.
check "index with no adapter" equals "$("$probe" 5)" \
    "there is no adapter hci5; the kernel knows hci$index (ls /sys/class/bluetooth)"
exec 4< <(exec "$probe" --hold "$index")
holder=$!
read -r -t 10 -u 4 held || held="(nothing within 10 s)"
check "a first holder takes it" equals "$held" ok
check "a second holder is refused" equals "$("$probe" "$index")" \
    "the adapter is up or in use, for example by the system's Bluetooth service: bring it down, e.g. btmgmt --index $index power off, or stop the service (systemctl stop bluetooth)"
kill "$holder"
wait "$holder" 2>/dev/null
check "root without CAP_NET_ADMIN" equals "$(setpriv --inh-caps=-all --bounding-set=-net_admin "$probe" "$index")" \
    "no permission: the HCI user channel needs CAP_NET_ADMIN; run as root, e.g. with sudo (a file capability on java does not work: its launcher then fails to find its own libraries)"

# 4. The adapter removed during a step, over the AIDL HAL this time: the
#    simulator stops, closing /dev/vhci.
./halvenor --hal aidl --hci "hci:$index" --trace rx --freq 2440 --phy 1M --duration 30 >"$scratch/rx" 2>"$scratch/trace" &
console=$!
for _ in $(seq 150); do
    grep -q "LE Receiver Test" "$scratch/trace" && break
    sleep 0.1
done
kill "$sim"
removed=$EPOCHREALTIME
wait "$console"
status=$?
took=$(awk -v a="$removed" -v b="$EPOCHREALTIME" 'BEGIN {printf "%.1f", b - a}')
check "removal during rx: exit status 1" equals "$status" 1
check "removal during rx: the step names the cause" has "$scratch/rx" "hci:$index: the adapter went away"
grep "^FAILED" "$scratch/rx" | sed 's/^/  | /'
check "removal during rx: ended ${took} s after it (under 5 s)" awk -v t="$took" 'BEGIN {exit !(t < 5)}'
check "after the removal" equals "$("$probe" "$index")" \
    "there is no adapter hci$index; the kernel knows no Bluetooth adapter here"

echo "$passed passed, $failed failed"
[ "$failed" -eq 0 ]
