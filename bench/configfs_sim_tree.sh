#!/bin/sh
# Builds a tree of 256 iSCSI targets in the simulated kernel target with the commands an
# administrator types (mkdir, echo, ln -s), tears it down again in the kernel's order,
# and prints operations per second for each half.  Needs root and /dev/fuse.
#
# Usage: bench/configfs_sim_tree.sh [BIN_DIR]   (default: build/bin beside this script)
set -eu
BIN=${1:-$(dirname "$0")/../build/bin}
SIM=$BIN/orlo-configfs-sim
[ -x "$SIM" ] || { echo "no $SIM" >&2; exit 1; }
ROOT=$(mktemp -d /tmp/orlo-simtree-XXXXXX)
M=$ROOT/config
mkdir -p "$M" "$ROOT/volume1"
: > "$ROOT/volume1/lun.img"
"$SIM" --root "$ROOT" --daemon "$M"
cleanup() { fusermount3 -u "$M" 2>/dev/null || umount -l "$M" 2>/dev/null || true; rm -rf "$ROOT"; }
trap cleanup EXIT
for m in rodsp_ep orlo_extent_pool target_core_mod target_core_iblock target_core_file target_core_ep \
         iscsi_target_mod; do
    echo "insert $m" > "$M/.sim/modules"
done
mkdir "$M/target/iscsi"
INIT=iqn.1991-05.com.example:host
now() { date +%s.%N; }
ops=0
t0=$(now)
i=1
while [ $i -le 256 ]; do
    B=$M/target/core/fileio_0/LUN_$i
    G=$M/target/iscsi/iqn.2000-01.com.orlo:t$i/tpgt_1
    mkdir "$B"
    echo "fd_dev_name=/volume1/lun.img,fd_dev_size=1048576,thin_provision=1,block_size=512,enable_sink=x,fd_dio=0" > "$B/control"
    echo "bench-$i" > "$B/attrib/lun_name"
    echo 1 > "$B/alua/default_tg_pt_gp/alua_access_type"
    echo 1 > "$B/enable"
    mkdir "$M/target/iscsi/iqn.2000-01.com.orlo:t$i" "$G"
    echo 16 > "$G/attrib/default_cmdsn_depth"
    mkdir "$G/np/127.0.0.1:3260"
    echo 0 > "$G/attrib/authentication"
    echo CRC32C,None > "$G/param/DataDigest"
    echo CRC32C,None > "$G/param/HeaderDigest"
    echo "Orlo Target" > "$G/param/TargetAlias"
    mkdir "$G/lun/lun_0"
    ln -s "$B" "$G/lun/lun_0/LUN_$i"
    mkdir "$G/acls/$INIT" "$G/acls/$INIT/lun_0"
    ln -s "$G/lun/lun_0" "$G/acls/$INIT/lun_0/lio_lun"
    echo 0 > "$G/acls/$INIT/lun_0/write_protect"
    echo 1 > "$G/enable"
    ops=$((ops + 22))
    i=$((i + 1))
done
t1=$(now)
built=$ops
i=1
while [ $i -le 256 ]; do
    T=$M/target/iscsi/iqn.2000-01.com.orlo:t$i
    G=$T/tpgt_1
    echo 0 > "$G/enable"
    rmdir "$G/np/127.0.0.1:3260"
    rm "$G/acls/$INIT/lun_0/lio_lun"
    rmdir "$G/acls/$INIT/lun_0" "$G/acls/$INIT"
    rm "$G/lun/lun_0/LUN_$i"
    rmdir "$G/lun/lun_0" "$G" "$T" "$M/target/core/fileio_0/LUN_$i"
    ops=$((ops + 10))
    i=$((i + 1))
done
t2=$(now)
[ -z "$(ls "$M/target/iscsi")" ] || { echo "tree not empty after teardown" >&2; exit 1; }
awk -v b="$built" -v d="$((ops - built))" -v t0="$t0" -v t1="$t1" -v t2="$t2" 'BEGIN {
    printf "build    256 targets: %6d ops in %6.3f s = %8.0f ops/s\n", b, t1 - t0, b / (t1 - t0);
    printf "teardown 256 targets: %6d ops in %6.3f s = %8.0f ops/s\n", d, t2 - t1, d / (t2 - t1);
    printf "(each mkdir, ln and rmdir is a process of its own; the FUSE side is measured by configfs_sim_bench)\n";
}'
