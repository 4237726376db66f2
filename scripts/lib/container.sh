#!/usr/bin/env bash
# Runs what is in a root in a container of systemd-nspawn. Sourced after common.sh, never run.

# Seconds that a container has to end in once it was asked to, before it is killed.
container_grace=30
# What nspawn says where the machine, or the container that this runs in, lets it make none. It ends
# with 1 then, but with 1, too, where the root is at fault.
container_refusals='Operation not permitted|Permission denied|Read-only file system'

# contain LIMIT TREE LOG ARGUMENT...: runs `systemd-nspawn ARGUMENT...` in the root TREE for LIMIT
# seconds at most, writes what it says into LOG, and prints how that went:
#
#   ended      within its time, with success
#   refused    no container can be made here
#   late       it was still there at the limit, or was killed
#   failed N   anything else: N is the status
contain() {
  local limit=$1 tree=$2 log=$3 status=0
  shift 3
  LC_ALL=C timeout --kill-after="$container_grace" "$limit" \
    systemd-nspawn --quiet --register=no --keep-unit --private-network --link-journal=no \
    --directory="$tree" "$@" >"$log" 2>&1 </dev/null || status=$?
  case $status in
    0) echo ended ;;
    # Asked to end at the limit, whatever it answered; killed, since that was of no use.
    124 | 137) echo late ;;
    1) grep -qE "$container_refusals" "$log" && echo refused || echo failed 1 ;;
    *) echo "failed $status" ;;
  esac
}

# are_containers_refused LIMIT TREE LOG: whether none can be made here. Where that cannot be told from
# a fault, it is a fault. Programs of the root must be known to run without a container.
are_containers_refused() {
  local went
  went=$(contain "$1" "$2" "$3" /bin/true)
  case $went in
    ended) return 1 ;;
    refused) return 0 ;;
  esac
  tail -n 20 "$3"
  [ "$went" != late ] || die "a container neither starts nor is refused within $1 s"
  die "a container does not start in the root, and nothing refuses it: $went"
}

# boot LIMIT TREE LOG: starts the root's own service manager, which has to end by itself with success.
# What it ran writes its status to /opt/status in the root, and what it has to say to /opt/log.
boot() {
  local went
  rm -f "$2/opt/status" "$2/opt/log"
  went=$(contain "$1" "$2" "$3" --boot)
  cat "$2/opt/log" 2>/dev/null || true
  if [ "$went" != ended ]; then
    tail -n 20 "$3"
    [ "$went" != late ] || die "the root was not through within $1 s; all of the boot is in $3"
    die "the root's manager did not end as it should: $went; all of the boot is in $3"
  fi
  if [ "$(cat "$2/opt/status" 2>/dev/null)" != 0 ]; then
    tail -n 20 "$3"
    die "the installed service does not hold what it should; all of the boot is in $3"
  fi
}
