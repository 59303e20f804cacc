#!/bin/sh
# The agent on the simulator: waits for its sensor list, has the simulated
# controller log one SEL event (SIGUSR1 with TAV_IPMI_SIM_CONTROL=1), waits for
# the alert line, then stops the agent with SIGTERM and wants a clean exit.
# Usage: run_agent.sh AGENT RULES_FILE VAR=VALUE...
# The variables (the simulator's) reach the agent alone: this script's own
# sleeps must stay real.
set -u
agent=$1 rules=$2
shift 2
out=$(mktemp)
trap 'rm -f "$out"' EXIT
env "$@" TAV_IPMI_SIM_CONTROL=1 "$agent" "$rules" >"$out" 2>&1 &
pid=$!
waitfor() {
  for _ in $(seq 600); do  # a minute: a pass can take 16 s of real time
    grep -q "$1" "$out" && return 0
    kill -0 "$pid" 2>/dev/null || break
    sleep 0.1
  done
  echo "no \"$1\" from the agent:"; cat "$out"; kill -9 "$pid" 2>/dev/null; exit 1
}
waitfor "^monitoring"
# Under ThreadSanitizer the simulator's control signal does not reach it
# when run from ctest; the alert is then left out (TAV_AGENT_ALERT=0).
if [ "${TAV_AGENT_ALERT:-1}" = 1 ]; then
  kill -USR1 "$pid"
  waitfor "^ALERT record"
fi
kill -TERM "$pid"
wait "$pid"
rc=$?
cat "$out"
[ "$rc" -eq 0 ] && grep -q "health 5" "$out" && grep -q "^stopped" "$out"
