#!/usr/bin/env bash
# A real Prometheus scrapes `tavipmi serve --simulate` on loopback: the series
# it ingests carry the readings the tool's JSON shows, scrapes cause no
# exchange with the controller, an event added to the simulated SEL is
# counted once, and SIGTERM stops the tool cleanly. Reports
# itself skipped when Debian's prometheus cannot be installed.
# Usage: scripts/prometheus-test.sh [BUILD_DIR]
set -euo pipefail
cd "$(dirname "$0")/.."
build=$(cd "${1:-build}" && pwd)
tool="$build/tools/tavipmi"

am=prometheus-alertmanager
if ! command -v prometheus >/dev/null || ! command -v promtool >/dev/null || ! command -v $am >/dev/null; then
  sudo=""
  [ "$(id -u)" -ne 0 ] && sudo="sudo"
  { $sudo apt-get update -qq && DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends \
      prometheus prometheus-alertmanager; } >/dev/null 2>&1 || true
fi
if ! command -v prometheus >/dev/null || ! command -v promtool >/dev/null || ! command -v $am >/dev/null; then
  echo "prometheus test: skipped (Debian's prometheus and prometheus-alertmanager cannot be installed)"
  exit 0
fi
for need in curl python3; do command -v $need >/dev/null || { echo "prometheus test: $need missing" >&2; exit 1; }; done

work=$(mktemp -d)
serve_pid=""
prom_pid=""
cleanup() {
  [ -n "$prom_pid" ] && kill "$prom_pid" 2>/dev/null && wait "$prom_pid" 2>/dev/null
  [ -n "$serve_pid" ] && kill "$serve_pid" 2>/dev/null && wait "$serve_pid" 2>/dev/null
  rm -rf "$work"
}
trap cleanup EXIT
fail() {
  echo "prometheus test: $*" >&2
  sed 's/^/  serve: /' "$work/serve.err" >&2 || true
  exit 1
}
# Runs a command until it succeeds, at most $1 times, a second apart.
retry() {
  local n=$1
  shift
  for ((i = 0; i < n; i++)); do "$@" && return 0; sleep 1; done
  return 1
}

# The tool on the simulator, on any free loopback port; the simulator takes
# SIGUSR2 (print exchange counts) and SIGUSR1 (add a SEL event).
TAV_IPMI_SIM_CONTROL=1 "$tool" --simulate serve --listen 127.0.0.1:0 --interval 1 2>"$work/serve.err" &
serve_pid=$!
retry 30 grep -q "serving metrics on" "$work/serve.err" || fail "serve did not start"
target=$(sed -n 's|.*serving metrics on http://\([^/]*\)/metrics|\1|p' "$work/serve.err")
prom_port=$(python3 -c 'import socket; s=socket.socket(); s.bind(("127.0.0.1", 0)); print(s.getsockname()[1])')

cat >"$work/prometheus.yml" <<YML
global:
  scrape_interval: 1s
  scrape_timeout: 1s
scrape_configs:
  - job_name: tavipmi
    static_configs:
      - targets: ['$target']
YML
prometheus --config.file="$work/prometheus.yml" --storage.tsdb.path="$work/data" \
  --web.listen-address="127.0.0.1:$prom_port" >"$work/prometheus.log" 2>&1 &
prom_pid=$!
api="http://127.0.0.1:$prom_port/api/v1"
query() { curl -sf --max-time 5 "$api/query" --data-urlencode "query=$1"; }
ingested() { query 'tavipmi_sensor_health_state' | grep -q '"value"'; }
retry 60 ingested || { cat "$work/prometheus.log" >&2; fail "prometheus ingested no series from $target"; }

# Every reading the tool's JSON shows is a series with the same value.
"$tool" --simulate sensors --format json >"$work/sensors.json"
query '{__name__=~"tavipmi_sensor_.+",__name__!~"tavipmi_sensor_(threshold_.+|state|health_state)"}' >"$work/readings.json"
python3 - "$work/sensors.json" "$work/readings.json" <<'PY' || fail "scraped readings differ from the tool's JSON"
import json, sys
tool = json.load(open(sys.argv[1]))["sensors"]
scraped = {(r["metric"]["name"], r["metric"]["number"]): float(r["value"][1])
           for r in json.load(open(sys.argv[2]))["data"]["result"]}
want = {(s["name"], str(s["number"])): s["reading"] for s in tool if s["reading"] is not None}
if not want or scraped != want:
    print("tool:", want, "\nscraped:", scraped, file=sys.stderr)
    sys.exit(1)
print("prometheus test: %d readings equal the tool's JSON" % len(want))
PY

# Scrapes are answered from the caches: over several scrapes, no command but
# the polling loop's own SEL check reaches the controller.
counts() {
  local before
  before=$(grep -c "exchanges total" "$work/serve.err" || true)
  kill -USR2 "$serve_pid"
  retry 10 test "$(grep -c "exchanges total" "$work/serve.err")" -gt "$before" || fail "no exchange counts"
  # The latest counts per command ("netfn cmd: count"), all but Get SEL Info.
  awk '/exchanges netfn/ {n[$5" "$7] = $8} END {for (k in n) print k, n[k]}' "$work/serve.err" |
    grep -v "^0x0a 0x40:" | sort
}
scrapes() {
  query 'count_over_time(up{job="tavipmi"}[1h])' |
    python3 -c 'import json,sys; r=json.load(sys.stdin)["data"]["result"]; print(int(float(r[0]["value"][1])) if r else 0)'
}
first=$(counts)
[ -n "$first" ] || fail "no exchange counts"
scraped_before=$(scrapes)
for _ in 1 2 3 4 5; do curl -sf --max-time 5 -o /dev/null "http://$target/metrics" || fail "scrape failed"; done
sleep 3
second=$(counts)
scraped=$(($(scrapes) - scraped_before))
[ "$first" = "$second" ] || fail "scrapes caused exchanges: $(diff <(echo "$first") <(echo "$second") || true)"
[ "$scraped" -gt 0 ] || fail "prometheus did not scrape meanwhile"
echo "prometheus test: 5 direct scrapes and $scraped by Prometheus caused no exchange"

# One event added to the simulated SEL shows as one more count, once the
# polling loop (a pass every 16 s) has handed it over and Prometheus scraped.
value() {
  query "$1" | python3 -c 'import json,sys; r=json.load(sys.stdin)["data"]["result"]; print(int(float(r[0]["value"][1])) if r else -1)'
}
events_before=$(value 'sum(tavipmi_sel_events_total)')
entries_before=$(value 'tavipmi_sel_entries')
[ "$events_before" -ge 0 ] && [ "$entries_before" -ge 0 ] || fail "no SEL series"
kill -USR1 "$serve_pid"
one_more() { [ "$(value 'sum(tavipmi_sel_events_total)')" -eq $((events_before + 1)) ]; }
retry 60 one_more || fail "the added SEL event was not counted once ($(value 'sum(tavipmi_sel_events_total)') after $events_before)"
sleep 2
[ "$(value 'sum(tavipmi_sel_events_total)')" -eq $((events_before + 1)) ] || fail "the SEL event was counted twice"
[ "$(value 'tavipmi_sel_entries')" -eq $((entries_before + 1)) ] || fail "SEL entries did not grow by one"
[ "$(value 'tavipmi_sel_events_total{severity="critical"}')" -ge 1 ] || fail "the upper critical event is not counted as critical"
echo "prometheus test: one SEL event added, one more count (critical) and one more entry"

kill -TERM "$serve_pid"
wait "$serve_pid" || fail "serve exited with status $? on SIGTERM"
serve_pid=""
echo "prometheus test: passed"
