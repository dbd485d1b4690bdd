#!/usr/bin/env bash
# The system's main job end to end, in a sandbox root, as an administrator would do it:
# a fresh appliance root with a tmpfs data volume and the simulated kernel target, the
# service started, LUNs of two kinds, a CHAP target with an access list and mappings,
# status and sessions, a stop and a start that rebuilds the kernel tree from the files,
# a snapshot taken, held against deletion, released and deleted, and a total stop.
# Every step is printed as the command a person would type, then its output.  Whatever
# happens (a failing step, Ctrl-C, SIGTERM) nothing stays mounted or running and the
# root is removed.
#
#   tools/demo/orlo-demo.sh [BINDIR]      (BINDIR: where orloiscsi and the simulator are;
#                                          build/bin by default)
#
# Needs root (a tmpfs mount and a FUSE file system).
set -uo pipefail

here=$(cd "$(dirname "$0")/../.." && pwd)
BIN=$(cd "${1:-$here/build/bin}" 2>/dev/null && pwd) || { echo "orlo-demo: no build directory ${1:-$here/build/bin}; run 'make build' first" >&2; exit 1; }
for p in orloiscsi orlo-configfs-sim orlo-sim-insmod orlocommd orlocomm-cat; do
    [ -x "$BIN/$p" ] || { echo "orlo-demo: $BIN/$p is missing; run 'make build' first" >&2; exit 1; }
done
if [ "$(id -u)" != 0 ]; then
    echo "orlo-demo: run as root: the data volume is a tmpfs mount and the kernel target a FUSE file system" >&2
    exit 1
fi
export PATH="$BIN:$PATH"

ROOT=""
SIM_PID=""
CAT_PID=""
STEP=0
FAILED=""

bold() { if [ -t 1 ]; then printf '\033[1m%s\033[0m\n' "$*"; else printf '%s\n' "$*"; fi; }

# Prints a command as typed (with $ROOT as the reader sees it), then runs it.  A failing
# command ends the demo, unless the step says it is expected to fail.
run() {
    printf '$ %s\n' "$*"
    eval "$*"
    local rc=$?
    if [ $rc -ne 0 ]; then
        echo "orlo-demo: the step above failed (exit status $rc)" >&2
        FAILED=1
        exit $rc
    fi
    echo
}
# The same, for a command that is meant to be refused.
refused() {
    printf '$ %s\n' "$*"
    eval "$*"
    local rc=$?
    if [ $rc -eq 0 ]; then
        echo "orlo-demo: the step above should have been refused" >&2
        FAILED=1
        exit 1
    fi
    echo "(refused, exit status $rc, as it should be)"
    echo
}
step() {
    STEP=$((STEP + 1))
    bold "== $STEP. $* =="
}

# Processes still running with this root as their appliance root (background workers
# the library started, daemons given --root), if any.
stragglers() {
    local pid dir
    for dir in /proc/[0-9]*; do
        pid=${dir#/proc/}
        [ "$pid" = $$ ] && continue
        if tr "\0" "\n" 2>/dev/null <"$dir/environ" | grep -qxF "ORLO_SYSROOT=$ROOT" ||
           tr "\0" "\n" 2>/dev/null <"$dir/cmdline" | grep -qxF "$ROOT"; then
            echo "$pid"
        fi
    done
}

cleanup() {
    local rc=$?
    trap '' INT TERM
    [ -n "$ROOT" ] || exit $rc
    echo
    bold "== Cleaning up $ROOT =="
    if [ -n "$SIM_PID" ] && kill -0 "$SIM_PID" 2>/dev/null; then
        # Best effort: take everything out of the (simulated) kernel and stop the
        # service's background work before the kernel goes away.
        orloiscsi --root "$ROOT" --quiet service total-stop >/dev/null 2>&1 ||
            orloiscsi --root "$ROOT" service total-stop >/dev/null 2>&1
        kill -TERM "$SIM_PID" 2>/dev/null
        for _ in $(seq 50); do kill -0 "$SIM_PID" 2>/dev/null || break; sleep 0.1; done
        kill -KILL "$SIM_PID" 2>/dev/null
    fi
    local p
    [ -n "$CAT_PID" ] && kill -TERM "$CAT_PID" 2>/dev/null
    if [ -f "$ROOT/var/run/iscsi_snapshot_comm_core.pid" ]; then
        kill -TERM "$(cat "$ROOT/var/run/iscsi_snapshot_comm_core.pid")" 2>/dev/null
    fi
    for p in $(stragglers); do kill -TERM "$p" 2>/dev/null; done
    sleep 0.2
    for p in $(stragglers); do kill -KILL "$p" 2>/dev/null; done
    for m in config volume1; do
        if mountpoint -q "$ROOT/$m" 2>/dev/null; then
            umount "$ROOT/$m" 2>/dev/null || umount -l "$ROOT/$m"
        fi
    done
    local left
    left=$(awk -v r="$ROOT/" 'index($2, r) == 1 { print $2 }' /proc/mounts)
    if [ -n "$left" ]; then
        echo "orlo-demo: still mounted: $left" >&2
        rc=1
    elif [ -n "$(stragglers)" ]; then
        echo "orlo-demo: processes still running in the root: $(stragglers)" >&2
        rc=1
    else
        rm -rf --one-file-system "$ROOT"
        echo "nothing left mounted or running; $ROOT removed"
    fi
    if [ $rc -eq 0 ] && [ -z "$FAILED" ]; then bold "The demo ran to its end."; fi
    exit $rc
}
trap cleanup EXIT
trap 'echo; echo "orlo-demo: interrupted" >&2; FAILED=1; exit 130' INT TERM

# ---------------------------------------------------------------------------------------
step "A fresh appliance root"
ROOT=$(mktemp -d /tmp/orlo-demo.XXXXXX)
printf '$ ROOT=$(mktemp -d /tmp/orlo-demo.XXXXXX)    # %s\n\n' "$ROOT"
run 'mkdir $ROOT/volume1 $ROOT/config'
run 'mount -t tmpfs -o size=1G tmpfs $ROOT/volume1                # the data volume /volume1'
echo '# The kernel target, simulated: mounted at /config, with its module files and an'
echo '# insmod that hands them to it.  Its clones advance 50% a second, as a small LUN'"'"'s'
echo '# would on the appliance.'
printf '$ orlo-configfs-sim --clone-rate 50 --root $ROOT $ROOT/config &\n'
orlo-configfs-sim --clone-rate 50 --root "$ROOT" "$ROOT/config" &
SIM_PID=$!
for _ in $(seq 100); do [ -d "$ROOT/config/.sim" ] && break; sleep 0.05; done
[ -d "$ROOT/config/.sim" ] || { echo "orlo-demo: the simulator did not come up" >&2; FAILED=1; exit 1; }
echo
run 'mkdir -p $ROOT/sbin $ROOT/lib/modules $ROOT/etc.defaults && cp $(command -v orlo-sim-insmod) $ROOT/sbin/insmod'
run 'for m in rodsp_ep orlo_extent_pool target_core_mod target_core_iblock target_core_file target_core_ep iscsi_target_mod; do touch $ROOT/lib/modules/$m.ko; done'
run "printf 'support_iscsi_target=\"yes\"\\niscsi_target_type=\"lio4x\"\\n' > \$ROOT/etc.defaults/orloinfo.conf"

step "Starting the service"
run 'orloiscsi --root $ROOT service start'
run 'ls $ROOT/config/target'

step "LUNs of two kinds"
run 'orloiscsi --root $ROOT lun create --name files --type FILE --size 64M --volume /volume1'
run 'orloiscsi --root $ROOT lun create --name pool --type ADV --size 1G --volume /volume1'
run 'orloiscsi --root $ROOT lun list'
refused 'orloiscsi --root $ROOT lun create --name files --type FILE --size 64M --volume /volume1'

step "A target with CHAP and an access list"
run 'echo demo-secret-42 | orloiscsi --root $ROOT target create demo --iqn iqn.2000-01.com.orlo-nas:demo --chap demo-user --secret-file -'
run 'orloiscsi --root $ROOT acl add demo iqn.1991-05.com.example:client --rw'
run 'orloiscsi --root $ROOT acl default demo none'
run 'orloiscsi --root $ROOT target show demo'

step "Mappings"
run 'orloiscsi --root $ROOT map add demo files'
run 'orloiscsi --root $ROOT map add demo pool'
run 'orloiscsi --root $ROOT map list'
run 'ls $ROOT/config/target/iscsi/iqn.2000-01.com.orlo-nas:demo/tpgt_1/lun'

step "Status and sessions"
echo '# An initiator logs in (the simulator is told, as the kernel would see it).'
run 'echo "add iqn.2000-01.com.orlo-nas:demo 1 iqn.1991-05.com.example:client 192.0.2.50 1" > $ROOT/config/.sim/sessions'
run 'orloiscsi --root $ROOT target status demo'
run 'orloiscsi --root $ROOT target sessions demo'

step "Stopping the service, and starting it again from the files alone"
run 'orloiscsi --root $ROOT service stop'
run 'echo "target nodes in the kernel: $(ls $ROOT/config/target/iscsi | wc -l)"'
run 'orloiscsi --root $ROOT service start'
run 'orloiscsi --root $ROOT target status demo'
run 'ls $ROOT/config/target/iscsi/iqn.2000-01.com.orlo-nas:demo/tpgt_1/lun'

step "Snapshots"
echo '# The kernel clones the advanced LUN into the snapshot while the LUN stays online;'
echo '# --wait waits until the clone is done and the snapshot Healthy.'
run 'orloiscsi --root $ROOT snapshot create pool --name before-upgrade --note "taken by the demo" --wait'
run 'orloiscsi --root $ROOT snapshot list'
echo '# Backup software holds the snapshot with its key: deleting it is refused meanwhile.'
run 'orloiscsi --root $ROOT snapshot hold pool before-upgrade backup-app'
run 'orloiscsi --root $ROOT snapshot list pool'
refused 'orloiscsi --root $ROOT snapshot delete pool before-upgrade'
run 'orloiscsi --root $ROOT snapshot release pool before-upgrade backup-app'
run 'orloiscsi --root $ROOT snapshot delete pool before-upgrade'
run 'orloiscsi --root $ROOT snapshot list pool'

step "Two services talking through the messaging engine"
run 'orlocommd --root $ROOT                                     # the engine: FIFOs under /tmp, TCP port 3262'
printf '$ orlocomm-cat --root $ROOT --name greeter --echo > $ROOT/greeter.out &\n'
orlocomm-cat --root "$ROOT" --name greeter --echo >"$ROOT/greeter.out" 2>&1 &
CAT_PID=$!
for _ in $(seq 50); do
    orlocomm-cat --root "$ROOT" --ping localhost greeter 2>/dev/null | grep -q 0x1022 && break
    sleep 0.1
done
echo
run 'orlocomm-cat --root $ROOT --ping localhost greeter'
run "printf 'hello\\nworld\\n' | orlocomm-cat --root \$ROOT --connect localhost greeter --wait-reply"
kill "$CAT_PID" 2>/dev/null; wait "$CAT_PID" 2>/dev/null; CAT_PID=""
run 'cat $ROOT/greeter.out                                      # what the service received'
run 'kill $(cat $ROOT/var/run/iscsi_snapshot_comm_core.pid)      # the engine stops cleanly'

step "One look at everything, while it runs"
run 'orloiscsi --root $ROOT overview'

step "Taking everything out of the kernel"
run 'orloiscsi --root $ROOT service total-stop'
run 'cat $ROOT/config/.sim/modules; echo "(no module left)"'

step "One look at everything: stored, and what the kernel no longer has"
run 'orloiscsi --root $ROOT overview'
