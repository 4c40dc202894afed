# shellcheck shell=bash disable=SC2154
# Shared by the test script: steps that are counted and timed, and jobs beside them. It ends with the
# table of times and the line that counts what passed and what failed.

passed=0
failed=0
failures=()
complete=
reports=$build/reports

count() {
  passed=$((passed + $1))
  failed=$((failed + $2))
}

fail() {
  count 0 1
  failures+=("$1")
  printf 'FAILED: %s\n' "$1"
}

# Sets $processor to the seconds of processor time that everything which has ended by now took. "times"
# speaks of the shell that it runs in: not to be called in a subshell.
processor=0
take_processor_time() {
  times >"$build/times"
  processor=$(tr 'ms' '  ' <"$build/times" |
    awk '{ sum += $1 * 60 + $2 + $3 * 60 + $4 } END { printf "%d", sum }')
}

# timed NAME COMMAND...: a row of the table of times.
times_table=()
timed() {
  local name=$1 status=0 begin=$SECONDS before
  shift
  take_processor_time
  before=$processor
  "$@" || status=$?
  take_processor_time
  times_table+=("$(printf '%-44s %8d %10d' "$name" $((SECONDS - begin)) $((processor - before)))")
  return "$status"
}

# check NAME COMMAND...: a step that counts as one test.
check() {
  local name=$1
  step "$name"
  if timed "$@"; then
    count 1 0
  else
    fail "$name"
  fi
}

# suite NAME COMMAND...: a step that leaves JUnit reports in $reports/NAME, which are counted.
suite() {
  local name=$1 status=0 good bad
  step "$name"
  rm -rf "${reports:?}/$name"
  mkdir -p "$reports/$name"
  timed "$@" "$reports/$name" || status=$?
  read -r good bad < <("$python" scripts/tally.py "$reports/$name") || true
  count "${good:-0}" "${bad:-0}"
  [ "${bad:-0}" -eq 0 ] || failures+=("$name: $bad")
  if [ "${good:-0}" -eq 0 ]; then
    fail "$name: no test passed"
  elif [ "$status" -ne 0 ] && [ "${bad:-0}" -eq 0 ]; then
    fail "$name: ended with status $status"
  fi
}

# begin NAME COMMAND...: starts a job that takes what the steps leave of the processors. Its output goes
# to $build/NAME.log. It is a process group, which can be ended as a whole.
declare -A job_pids=()
begin() {
  local name=$1
  shift
  set -m
  (
    renice -n 19 -p "$BASHPID" >/dev/null
    "$@"
  ) >"$build/$name.log" 2>&1 </dev/null &
  set +m
  job_pids[$name]=$!
}

# await NAME: the end of that job, and its status.
await() {
  local pid=${job_pids[$1]}
  unset "job_pids[$1]"
  wait "$pid"
}

end_jobs() {
  local pid
  for pid in "${job_pids[@]}"; do
    kill -- "-$pid" 2>/dev/null || true
    wait "$pid" 2>/dev/null || true
  done
}

# The processor time of a job that ran beside the steps is in the step that waited for it.
print_times() {
  [ "${#times_table[@]}" -gt 0 ] || return 0
  take_processor_time
  step 'Times'
  printf '%-44s %8s %10s\n' '' seconds processor
  printf '%s\n' "${times_table[@]}"
  printf '%-44s %8d %10d\n' 'all in all' "$SECONDS" "$processor"
}

# Whatever ended the script early is a failure too, a signal included.
finish() {
  [ -n "$complete" ] || fail 'the test script itself'
  end_jobs
  rm -rf "$TMPDIR"
  print_times
  step 'Result'
  [ "${#failures[@]}" -eq 0 ] || printf 'FAILED: %s\n' "${failures[@]}"
  [ -z "${left_out:-}" ] || printf 'Left out: %s\n' "$left_out"
  printf '%d passed, %d failed\n' "$passed" "$failed"
  [ "$failed" -eq 0 ] || exit 1
}
