#!/usr/bin/env bash
# A one-node Slurm cluster in a folder of its own, for the farm tests and for
# trying `orvane submit` on one machine. It needs Debian's slurm-wlm and munge
# (scripts/setup-deps.sh installs them). Its daemons run as the user who starts
# it, root or not, and run that user's jobs.
#   scripts/slurm-cluster.sh start DIR   makes DIR, starts munged, slurmctld and
#                                        slurmd there and waits for the node
#   scripts/slurm-cluster.sh stop DIR    cancels its jobs and stops the daemons
# The cluster touches nothing outside DIR (but a short-named folder under /tmp
# for its sockets when DIR's name is long): its own slurm.conf, munge key and
# socket, state, spool and log folders, and two free TCP ports on 127.0.0.1.
# Clients reach it with SLURM_CONF=DIR/slurm.conf (start prints the line).
# No cgroups (proctrack/linuxproc, task/none) and no accounting storage, so
# it works in a container; sacct has nothing to say, squeue and scontrol do.
set -euo pipefail

usage() {
  echo "usage: $0 start|stop DIR" >&2
  exit 2
}
[ $# -eq 2 ] || usage
action=$1
mkdir -p "$2"
dir=$(cd "$2" && pwd)

# Stops what a pid file names, and waits until it is gone.
stop_pid() {
  local file=$1 pid
  [ -f "$file" ] || return 0
  pid=$(cat "$file" 2>/dev/null || true)
  if [ -n "$pid" ] && kill -0 "$pid" 2>/dev/null; then
    kill "$pid" 2>/dev/null || true
    for _ in $(seq 50); do kill -0 "$pid" 2>/dev/null || break; sleep 0.1; done
    kill -9 "$pid" 2>/dev/null || true
  fi
  rm -f "$file"
}

stop() {
  if [ -f "$dir/slurm.conf" ] && [ -f "$dir/slurmctld.pid" ]; then
    SLURM_CONF="$dir/slurm.conf" timeout 10 scancel --user="$(id -un)" 2>/dev/null || true
  fi
  stop_pid "$dir/slurmd.pid"
  stop_pid "$dir/slurmctld.pid"
  stop_pid "$(runtime)/munge/munged.pid"
  # A short-named runtime folder made for a deep DIR goes with the cluster.
  if [ -f "$dir/runtime" ]; then
    rm -rf "$(cat "$dir/runtime")" "$dir/runtime"
  fi
}

# Where the sockets live: DIR, unless its name is too long for a socket path
# (108 bytes with the names Slurm adds), then a folder under /tmp named in DIR/runtime.
runtime() {
  if [ -f "$dir/runtime" ]; then cat "$dir/runtime"; else echo "$dir"; fi
}

# Prints the last lines of the daemons' logs (why a start failed).
show_logs() {
  for log in "$dir"/log/*.log; do
    [ -f "$log" ] || continue
    echo "--- $log" >&2
    tail -n 15 "$log" >&2
  done
}

# The first port from $1 up with nothing listening on it or on the next one.
free_port_pair() {
  local port=$1
  while (exec 3<>"/dev/tcp/127.0.0.1/$port") 2>/dev/null || (exec 3<>"/dev/tcp/127.0.0.1/$((port + 1))") 2>/dev/null; do
    port=$((port + 2))
  done
  echo "$port"
}

start() {
  for program in munged slurmctld slurmd sinfo; do
    command -v "$program" >/dev/null || {
      echo "slurm-cluster: $program is not installed (scripts/setup-deps.sh installs slurm-wlm and munge)" >&2
      exit 1
    }
  done
  stop
  rm -rf "$dir/state" "$dir/spool" "$dir/log" "$dir/munge"
  if [ ${#dir} -gt 48 ]; then
    mktemp -d /tmp/orvane-slurm.XXXXXX >"$dir/runtime"
  fi
  local rt
  rt=$(runtime)
  mkdir -p "$dir/state" "$dir/log" "$rt/spool" "$rt/munge"
  chmod 755 "$dir" "$rt" "$rt/munge"

  # A munge key made for this cluster alone.
  head -c 1024 /dev/urandom >"$rt/munge/munge.key"
  chmod 400 "$rt/munge/munge.key"
  munged --force --socket="$rt/munge/socket" --key-file="$rt/munge/munge.key" \
    --pid-file="$rt/munge/munged.pid" --seed-file="$rt/munge/seed" --log-file="$dir/log/munged.log" || {
    show_logs
    exit 1
  }

  local host user cpus memory port
  host=$(hostname -s)
  user=$(id -un)
  cpus=$(nproc)
  # The node offers all but 512 MiB of the machine; a task asks 1 GiB per CPU unless it says otherwise.
  memory=$(awk '/MemTotal/ { m = int($2 / 1024) - 512; print (m < 1024 ? 1024 : m) }' /proc/meminfo)
  port=$(free_port_pair 16817)
  cat >"$dir/slurm.conf" <<EOF
# A one-node test cluster made by scripts/slurm-cluster.sh.
ClusterName=orvane
SlurmctldHost=$host(127.0.0.1)
SlurmctldPort=$port
SlurmdPort=$((port + 1))
SlurmUser=$user
SlurmdUser=$user
AuthType=auth/munge
CredType=cred/munge
AuthInfo=socket=$rt/munge/socket
StateSaveLocation=$dir/state
SlurmdSpoolDir=$rt/spool
SlurmctldPidFile=$dir/slurmctld.pid
SlurmdPidFile=$dir/slurmd.pid
SlurmctldLogFile=$dir/log/slurmctld.log
SlurmdLogFile=$dir/log/slurmd.log
ProctrackType=proctrack/linuxproc
TaskPlugin=task/none
JobAcctGatherType=jobacct_gather/none
AccountingStorageType=accounting_storage/none
JobCompType=jobcomp/none
MailProg=/bin/true
MpiDefault=none
SwitchType=switch/none
SelectType=select/cons_tres
SelectTypeParameters=CR_Core_Memory
DefMemPerCPU=1024
SchedulerParameters=sched_interval=1
ReturnToService=2
SlurmctldTimeout=30
SlurmdTimeout=30
InactiveLimit=0
KillWait=5
MinJobAge=600
NodeName=$host NodeAddr=127.0.0.1 CPUs=$cpus RealMemory=$memory State=UNKNOWN
PartitionName=main Nodes=$host Default=YES MaxTime=INFINITE State=UP
EOF
  export SLURM_CONF="$dir/slurm.conf"
  slurmctld -f "$SLURM_CONF" || {
    show_logs
    exit 1
  }
  slurmd -f "$SLURM_CONF" || {
    show_logs
    exit 1
  }
  for _ in $(seq 60); do
    if [ "$(timeout 5 sinfo -h -o %T 2>/dev/null)" = idle ]; then
      echo "export SLURM_CONF=$SLURM_CONF"
      return 0
    fi
    sleep 0.5
  done
  echo "slurm-cluster: the node did not come up within 30 s" >&2
  timeout 5 sinfo >&2 || true
  show_logs
  stop
  exit 1
}

case "$action" in
  start) start ;;
  stop) stop ;;
  *) usage ;;
esac
