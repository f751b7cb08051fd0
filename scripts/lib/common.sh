# shellcheck shell=bash
# Helpers for our scripts: messages, background processes, and cleaning up. Source it from a bash script
# that runs with `set -euo pipefail`.
#
# A script that starts processes calls these first:
#   halvox_make_scratch NAME          # makes a directory of its own, $HALVOX_SCRATCH
#   halvox_clean_up_on_exit           # always stops the processes and removes the directory
# After a failure it first prints the ends of the logs in the scratch directory (*.log).

HALVOX_SCRIPT=${HALVOX_SCRIPT:-$(basename "$0")}
HALVOX_SCRATCH=${HALVOX_SCRATCH:-}
# Our processes, oldest first, as "pid name". Each leads a process group of its own.
HALVOX_PROCESSES=()
HALVOX_STOP_SECONDS=5

# Prints a line for the user.
say() { printf '%s\n' "$HALVOX_SCRIPT: $*"; }

# Prints the title of the next step.
step() { printf '\n==> %s\n' "$*"; }

# Ends the script with a message.
fail() {
  printf '%s\n' "$HALVOX_SCRIPT: $*" >&2
  exit 1
}

# Waits until a command succeeds: halvox_wait_for WHAT SECONDS COMMAND...
# Returns 1 and prints WHAT after that time.
halvox_wait_for() { halvox_wait_for_start "" "$@"; }

# The same for something that a process of ours does after its start: halvox_wait_for_start PID WHAT
# ... Returns at once if that process has ended.
halvox_wait_for_start() {
  local pid=$1 what=$2 seconds=$3 end
  shift 3
  end=$((SECONDS + seconds))
  until "$@" >/dev/null 2>&1; do
    if [ -n "$pid" ] && ! halvox_is_running "$pid"; then
      printf '%s\n' "$HALVOX_SCRIPT: waiting for $what: the process has ended" >&2
      return 1
    fi
    if ((SECONDS > end)); then
      printf '%s\n' "$HALVOX_SCRIPT: timed out after $seconds s waiting for $what" >&2
      return 1
    fi
    sleep 0.05
  done
}

# Starts a process in the background: halvox_start NAME LOG COMMAND...
# Sets HALVOX_PID. The process gets its own process group, so that a Ctrl-C reaches only the script,
# which then stops everything in order. It ends if the script is killed. Do not call this in a
# subshell: the process would belong to the subshell.
halvox_start() {
  local name=$1 log=$2
  shift 2
  setsid setpriv --pdeathsig TERM -- "$@" >>"$log" 2>&1 </dev/null &
  HALVOX_PID=$!
  HALVOX_PROCESSES+=("$HALVOX_PID $name")
}

halvox_is_running() { kill -0 "$1" 2>/dev/null; }

# Whether a process of the group that this process led still exists.
halvox_group_lives() { kill -0 -- "-$1" 2>/dev/null; }

halvox_forget() {
  local entry kept=()
  for entry in ${HALVOX_PROCESSES[@]+"${HALVOX_PROCESSES[@]}"}; do
    [ "${entry%% *}" = "$1" ] || kept+=("$entry")
  done
  HALVOX_PROCESSES=(${kept[@]+"${kept[@]}"})
}

# Waits for a process that ends by itself, and returns its exit status.
halvox_wait() {
  local status=0
  wait "$1" || status=$?
  halvox_forget "$1"
  return "$status"
}

# Stops a process and all processes that it started: with SIGTERM, after some seconds with SIGKILL.
halvox_stop() {
  local pid=$1 end=$((SECONDS + HALVOX_STOP_SECONDS))
  # The group exists only after the process has made it.
  kill -TERM -- "-$pid" 2>/dev/null || kill -TERM "$pid" 2>/dev/null || true
  while halvox_is_running "$pid" || halvox_group_lives "$pid"; do
    if ((SECONDS > end)); then
      kill -KILL -- "-$pid" 2>/dev/null || true
      break
    fi
    sleep 0.02
  done
  wait "$pid" 2>/dev/null || true
  halvox_forget "$pid"
}

# Stops all processes that still run, the newest first.
halvox_stop_all() {
  local entry
  while ((${#HALVOX_PROCESSES[@]} > 0)); do
    entry=${HALVOX_PROCESSES[-1]}
    halvox_stop "${entry%% *}"
  done
}

halvox_make_scratch() {
  HALVOX_SCRATCH=$(mktemp -d "${TMPDIR:-/tmp}/halvox-$1.XXXXXX")
}

# Shows the ends of the logs, to find out what went wrong.
halvox_show_logs() {
  local log
  for log in "$HALVOX_SCRATCH"/*.log; do
    [ -s "$log" ] || continue
    printf '\n--- the end of %s\n' "$(basename "$log")" >&2
    tail -n 15 "$log" >&2
  done
}

halvox_clean_up() {
  local status=$?
  trap '' INT TERM HUP
  # 129 and above: a signal such as Ctrl-C ended the script, which is not a failure.
  if ((status != 0 && status < 129)) && [ -n "$HALVOX_SCRATCH" ]; then
    halvox_show_logs
  fi
  halvox_stop_all
  [ -z "$HALVOX_SCRATCH" ] || rm -rf "$HALVOX_SCRATCH"
  exit "$status"
}

halvox_clean_up_on_exit() {
  trap halvox_clean_up EXIT
  trap 'exit 130' INT
  trap 'exit 143' TERM
  trap 'exit 129' HUP
}

# The progress in a log: the last "[3/120]", as Ninja writes it.
halvox_progress_in() {
  tail -c 4000 "$1" 2>/dev/null | grep -oE '\[[0-9]+/[0-9]+\]' | tail -n 1 || true
}

# Runs a command that takes long: halvox_run WHAT LOG COMMAND...
# Shows progress: a spinner with the seconds at a terminal, a line every ten seconds elsewhere. If
# the command fails, prints the end of its output and returns its status. The log is temporary.
halvox_run() {
  # shellcheck disable=SC1003  # a backslash, not a quote
  local what=$1 log=$2 pid status=0 begin=$SECONDS shown=0 ticks=0 spinner='|/-\'
  shift 2
  : >"$log"
  halvox_start "$what" "$log" "$@"
  pid=$HALVOX_PID
  while halvox_is_running "$pid"; do
    if [ -t 1 ]; then
      printf '\r%s %s %s %d s\033[K' "${spinner:ticks++%4:1}" "$what" \
        "$(halvox_progress_in "$log")" $((SECONDS - begin))
    elif ((SECONDS - begin >= shown + 10)); then
      shown=$((SECONDS - begin))
      say "$what $(halvox_progress_in "$log") $shown s"
    fi
    sleep 0.1
  done
  [ ! -t 1 ] || printf '\r\033[K'
  halvox_wait "$pid" || status=$?
  if ((status != 0)); then
    say "$what: failed (exit status $status); the end of its output:" >&2
    tail -n 30 "$log" >&2
    rm -f "$log"
    return "$status"
  fi
  rm -f "$log"
  say "$what: done in $((SECONDS - begin)) s"
}
