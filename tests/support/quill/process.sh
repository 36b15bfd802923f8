# Sourced by QuillAgent and QuillServer: starts and stops the process of one instance and keeps the run
# information up to date. The caller sets quill_home, the home without a trailing "/".
#
# shellcheck shell=sh disable=SC2154

run_info="$quill_home/config/.ConfigData/RunInfo"

die() { # STATUS MESSAGE
  printf '%s\n' "$2" >&2
  exit "$1"
}

# spawn FILE: starts a process that lives until it is killed and names FILE in its command line; prints its
# process id and that of its keeper, once ps shows it as a tail of FILE. The keeper is the parent that reaps it:
# a dead process that is not reaped still shows in ps. Neither holds a descriptor of the caller (a pipe, above
# all) or its directory; it takes bash to close descriptors of two digits.
spawn() {
  # shellcheck disable=SC2016
  setsid bash -c '
    for fd in /proc/self/fd/*; do
      [ "${fd##*/}" -le 2 ] || eval "exec ${fd##*/}>&-"
    done
    cd /
    tail -f "$1" </dev/null >/dev/null 2>&1 &
    word=
    while [ -d "/proc/$!" ] && [ "$word" != tail ]; do
      IFS= read -r -d "" word <"/proc/$!/cmdline"
    done
    echo "$! $$"
    exec </dev/null >/dev/null 2>&1
    wait' keeper "$1" </dev/null 2>/dev/null &
}

field_separator() { sed -n '1s/^[^=]*=//p' "$run_info"; }

# recorded_name CODE INSTANCE: the instance as the run information holds it.
recorded_name() {
  case "$1/$2" in
    */) echo None ;;
    xe/*) echo "$(uname -n | cut -d. -f1)_$2" ;;
    *) printf '%s\n' "$2" ;;
  esac
}

# recorded_pid CODE NAME: the process id of the first matching row; nothing when there is none.
recorded_pid() {
  while IFS=$(field_separator) read -r _ row_code row_pid row_name _; do
    if [ "$row_code" = "$1" ] && [ "$row_name" = "$2" ]; then
      echo "$row_pid"
      return
    fi
  done <"$run_info"
}

is_alive() { [ -n "$1" ] && [ -d "/proc/$1" ]; }

# file_of CODE NAME: the file that the process of the instance names in its command line.
file_of() { printf '%s\n' "$quill_home/control/processes/$1.$(printf %s "$2" | tr / _)"; }

# is_running PID CODE NAME: whether it is the process of this instance. The system gives the id of a process that
# has ended to another one; and the home may have several names.
is_running() {
  is_alive "$1" || return 1
  named=$({ tr '\0' '\n' <"/proc/$1/cmdline" | tail -n 1; } 2>/dev/null)
  # shellcheck disable=SC3013
  [ "$named" -ef "$(file_of "$2" "$3")" ]
}

# start_instance CODE INSTANCE
start_instance() {
  name=$(recorded_name "$1" "$2")
  pid=$(recorded_pid "$1" "$name")
  if is_running "$pid" "$1" "$name"; then
    return 0
  fi
  file=$(file_of "$1" "$name")
  [ -e "$file" ] || : >"$file"
  pids=$(spawn "$file")
  echo "$pids" >>"$quill_home/control/started"
  sep=$(field_separator)
  printf '%s\n' "$(uname -n)$sep$1$sep${pids% *}$sep$name$sep$(user_name)" >>"$run_info"
}

# stop_instance CODE INSTANCE
stop_instance() {
  name=$(recorded_name "$1" "$2")
  pid=$(recorded_pid "$1" "$name")
  is_running "$pid" "$1" "$name" || die 1 "not running: $1 $2"
  kill "$pid" || die 1 "cannot stop process $pid"
  await_end "$pid" || die 1 "process $pid does not end"
  sep=$(field_separator)
  rows=$(grep -v -F -e "$sep$1$sep$pid$sep" "$run_info")
  printf '%s\n' "$rows" >"$run_info" # in place: the file keeps its owner and mode
}

await_end() { # PID
  attempts=3000
  while is_alive "$1"; do
    attempts=$((attempts - 1))
    [ "$attempts" -gt 0 ] || return 1
    sleep 0.02
  done
}

# switch_of VERB CODE INSTANCE: the folder under control/ with the behaviour of this call, if any.
switch_of() {
  named="$quill_home/control/$1-$2-$(printf %s "${3:-None}" | tr / _)"
  if [ -d "$named" ]; then
    echo "$named"
  elif [ -d "$quill_home/control/$1-$2" ]; then
    echo "$quill_home/control/$1-$2"
  fi
}

# perform VERB CODE INSTANCE: starts or stops the instance, or does what a switch orders instead.
perform() {
  switch=$(switch_of "$@")
  if [ -z "$switch" ]; then
    "$1_instance" "$2" "$3"
    exit
  fi
  cat "$switch/out"
  cat "$switch/err" >&2
  [ ! -e "$switch/effective" ] || "$1_instance" "$2" "$3"
  exit "$(cat "$switch/status")"
}
