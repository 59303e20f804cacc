#!/usr/bin/env bash
# A real Prometheus scrapes `tavipmi serve --simulate` on loopback: the series
# it ingests carry the readings the tool's JSON shows, scrapes cause no
# exchange with the controller, an event added to the simulated SEL is
# counted once, and SIGTERM stops the tool cleanly. The shipped alert rules
# pass promtool's unit tests, and Prometheus evaluates them and sends to
# Alertmanager, which delivers to a webhook receiver: three scenes on the
# simulated controller (a SEL event, a sensor past its critical threshold,
# the controller going silent) each give one notification, timed from the
# change. A second `serve` behind --web.config.file is scraped over TLS with
# a client certificate and a user; a wrong password, no certificate and plain
# HTTP are refused. Everything listens on loopback only. Reports itself
# skipped when Debian's prometheus cannot be installed.
# Usage: scripts/prometheus-test.sh [BUILD_DIR]
set -euo pipefail
cd "$(dirname "$0")/.."
build=$(cd "${1:-build}" && pwd)
tool="$build/tools/tavipmi"

am=prometheus-alertmanager
if ! command -v prometheus >/dev/null || ! command -v promtool >/dev/null || ! command -v $am >/dev/null ||
  ! command -v openssl >/dev/null; then
  sudo=""
  [ "$(id -u)" -ne 0 ] && sudo="sudo"
  { $sudo apt-get update -qq && DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends \
      prometheus prometheus-alertmanager openssl; } >/dev/null 2>&1 || true
fi
if ! command -v prometheus >/dev/null || ! command -v promtool >/dev/null || ! command -v $am >/dev/null; then
  echo "prometheus test: skipped (Debian's prometheus and prometheus-alertmanager cannot be installed)"
  exit 0
fi
for need in curl python3 openssl; do command -v $need >/dev/null || { echo "prometheus test: $need missing" >&2; exit 1; }; done

work=$(mktemp -d)
serve_pid=""
prom_pid=""
am_pid=""
hook_pid=""
tls_pid=""
cleanup() {
  for pid in "$prom_pid" "$am_pid" "$hook_pid" "$tls_pid" "$serve_pid"; do
    # A process that dies of the signal is no failure of the test.
    [ -n "$pid" ] && kill "$pid" 2>/dev/null && { wait "$pid" 2>/dev/null || true; }
  done
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

free_port() { python3 -c 'import socket; s=socket.socket(); s.bind(("127.0.0.1", 0)); print(s.getsockname()[1])'; }
now() { date +%s.%N; }

promtool test rules tests/prometheus/tavipmi-rules.test.yml >"$work/promtool.log" 2>&1 ||
  { cat "$work/promtool.log" >&2; fail "promtool's unit tests of the shipped rules failed"; }
echo "prometheus test: the shipped rules pass promtool's unit tests"

# The webhook receiver: one JSON line per notification, with the time it came.
hook_port=$(free_port)
python3 - "$hook_port" "$work/notifications" <<'PY' >"$work/hook.log" 2>&1 &
import http.server, json, sys, time
port, out = int(sys.argv[1]), sys.argv[2]
class Hook(http.server.BaseHTTPRequestHandler):
    def do_POST(self):
        body = json.loads(self.rfile.read(int(self.headers["Content-Length"])))
        with open(out, "a") as f:
            f.write(json.dumps({"time": time.time(), "body": body}) + "\n")
        self.send_response(200)
        self.end_headers()
http.server.HTTPServer(("127.0.0.1", port), Hook).serve_forever()
PY
hook_pid=$!

# Alertmanager: short waits so that a scene takes seconds; a notification is
# repeated only after an hour, so a second one would be a fault. No cluster
# port: it would listen on every address.
am_port=$(free_port)
cat >"$work/alertmanager.yml" <<YML
route:
  receiver: hook
  group_by: [alertname, instance]
  group_wait: 1s
  group_interval: 1s
  repeat_interval: 1h
receivers:
  - name: hook
    webhook_configs:
      - url: http://127.0.0.1:$hook_port/
        send_resolved: true
YML
$am --config.file="$work/alertmanager.yml" --storage.path="$work/am" --web.listen-address="127.0.0.1:$am_port" \
  --cluster.listen-address= >"$work/alertmanager.log" 2>&1 &
am_pid=$!

# The tool on the simulator, on any free loopback port; the simulator takes
# SIGUSR2 (print exchange counts), SIGUSR1 (add a SEL event), SIGRTMIN (a
# sensor past its critical threshold) and SIGRTMIN+1 (the controller falls
# silent).
TAV_IPMI_SIM_CONTROL=1 "$tool" --simulate serve --listen 127.0.0.1:0 --interval 1 2>"$work/serve.err" &
serve_pid=$!
retry 30 grep -q "serving metrics on" "$work/serve.err" || fail "serve did not start"
target=$(sed -n 's|.*serving metrics on http://\([^/]*\)/metrics|\1|p' "$work/serve.err")
prom_port=$(free_port)

cat >"$work/prometheus.yml" <<YML
global:
  scrape_interval: 1s
  scrape_timeout: 1s
  evaluation_interval: 1s
rule_files:
  - $PWD/data/prometheus/tavipmi-rules.yml
alerting:
  alertmanagers:
    - static_configs:
        - targets: ['127.0.0.1:$am_port']
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
changed=$(now)
kill -USR1 "$serve_pid"
one_more() { [ "$(value 'sum(tavipmi_sel_events_total)')" -eq $((events_before + 1)) ]; }
retry 60 one_more || fail "the added SEL event was not counted once ($(value 'sum(tavipmi_sel_events_total)') after $events_before)"
sleep 2
[ "$(value 'sum(tavipmi_sel_events_total)')" -eq $((events_before + 1)) ] || fail "the SEL event was counted twice"
[ "$(value 'tavipmi_sel_entries')" -eq $((entries_before + 1)) ] || fail "SEL entries did not grow by one"
[ "$(value 'tavipmi_sel_events_total{severity="critical"}')" -ge 1 ] || fail "the upper critical event is not counted as critical"
echo "prometheus test: one SEL event added, one more count (critical) and one more entry"

# Firing notifications so far for an alert.
notified() {
  python3 - "$work/notifications" "$1" <<'PY'
import json, sys
path, name = sys.argv[1], sys.argv[2]
try:
    lines = open(path).read().splitlines()
except FileNotFoundError:
    lines = []
times = [n["time"] for n in map(json.loads, lines)
         if n["body"]["status"] == "firing" and n["body"]["commonLabels"].get("alertname") == name]
print(len(times), times[0] if times else 0)
PY
}
has_notification() { [ "$(notified "$1" | cut -d' ' -f1)" -ge 1 ]; }
# Waits for the alert's notification and prints the seconds since the change.
scene() {
  local alert=$1 since=$2 limit=$3
  retry "$limit" has_notification "$alert" ||
    { cat "$work/alertmanager.log" >&2; fail "no notification of $alert within $limit s"; }
  python3 -c "import sys; print('%.1f' % (float(sys.argv[1]) - float(sys.argv[2])))" \
    "$(notified "$alert" | cut -d' ' -f2)" "$since"
}
sel_time=$(scene BmcSelCriticalEvent "$changed" 60)
echo "prometheus test: scene 1, a critical SEL event logged: notified after $sel_time s"

changed=$(now)
kill -s RTMIN "$serve_pid"
sensor_time=$(scene BmcSensorCritical "$changed" 60)
[ "$(value 'tavipmi_sensor_celsius{name="Inlet Temp"}')" -eq 49 ] || fail "the inlet temperature is not 49 C"
echo "prometheus test: scene 2, the inlet temperature past its upper critical threshold: notified after $sensor_time s"

changed=$(now)
kill -s RTMIN+1 "$serve_pid"
silent_time=$(scene BmcDown "$changed" 120)
[ "$(value 'tavipmi_up')" -eq 0 ] || fail "tavipmi_up is not 0 with the controller silent"
[ "$(value 'tavipmi_exchanges_total{result="timeout"}')" -ge 10 ] || fail "the time-outs are not counted"
# Ten Get SEL Info tries a second apart.
[ "$(value 'tavipmi_last_pass_duration_seconds')" -ge 9 ] || fail "the silent pass did not take its ten tries"
echo "prometheus test: scene 3, the controller silent: notified after $silent_time s"

# One notification an alert, none repeated, no other alert fired.
sleep 5
python3 - "$work/notifications" <<'PY' || fail "notifications differ from one per scene"
import collections, json, sys
fired = collections.Counter(n["body"]["commonLabels"].get("alertname")
                            for n in map(json.loads, open(sys.argv[1]).read().splitlines())
                            if n["body"]["status"] == "firing")
want = {"BmcSelCriticalEvent": 1, "BmcSensorCritical": 1, "BmcDown": 1}
if fired != want:
    print("fired:", dict(fired), "\nwanted:", want, file=sys.stderr)
    sys.exit(1)
PY
echo "prometheus test: one notification per scene, none repeated"

# Who may scrape: TLS with a client certificate from our CA and a user with
# a bcrypt hash (of "scrape-secret"), as Prometheus's web configuration file
# gives them.
pki="$work/pki"
mkdir -p "$pki"
(
  cd "$pki"
  key() { openssl req -newkey ec -pkeyopt ec_paramgen_curve:P-256 -nodes -keyout "$1.key" -subj "/CN=$1" "${@:2}"; }
  key ca -x509 -days 2 -out ca.crt
  for who in server client; do
    key $who -out $who.csr
    ext="subjectAltName=IP:127.0.0.1"
    [ $who = client ] && ext="extendedKeyUsage=clientAuth"
    openssl x509 -req -in $who.csr -CA ca.crt -CAkey ca.key -CAcreateserial -days 2 -out $who.crt \
      -extfile <(echo "$ext")
  done
) >"$work/pki.log" 2>&1 || { cat "$work/pki.log" >&2; fail "openssl could not make the test certificates"; }
cat >"$work/web.yml" <<'YML'
tls_server_config:
  cert_file: pki/server.crt
  key_file: pki/server.key
  client_auth_type: RequireAndVerifyClientCert
  client_ca_file: pki/ca.crt
basic_auth_users:
  prometheus: $2b$10$i6sTF0zw7C8UEMmymxtSMeMK1jQo8ScnxxBtxBAYL8rRDeIwwjPP.
YML
"$tool" --simulate serve --listen 127.0.0.1:0 --web.config.file "$work/web.yml" 2>"$work/tls.err" &
tls_pid=$!
retry 30 grep -q "serving metrics on" "$work/tls.err" || { cat "$work/tls.err" >&2; fail "serve with TLS did not start"; }
tls_target=$(sed -n 's|.*serving metrics on https://\([^/]*\)/metrics|\1|p' "$work/tls.err")
[ -n "$tls_target" ] || fail "serve with TLS does not serve https: $(cat "$work/tls.err")"
scrape() { curl -s -o "$work/scraped" -w '%{http_code}' --max-time 5 --cacert "$pki/ca.crt" "$@"; }
code=$(scrape --cert "$pki/client.crt" --key "$pki/client.key" -u prometheus:scrape-secret "https://$tls_target/metrics")
[ "$code" = 200 ] && grep -q '^tavipmi_up 1' "$work/scraped" || fail "the TLS scrape with certificate and user got $code"
code=$(scrape --cert "$pki/client.crt" --key "$pki/client.key" -u prometheus:wrong "https://$tls_target/metrics")
[ "$code" = 401 ] || fail "a wrong password got $code, not 401"
code=$(scrape --cert "$pki/client.crt" --key "$pki/client.key" "https://$tls_target/metrics")
[ "$code" = 401 ] || fail "no user got $code, not 401"
code=$(scrape -u prometheus:scrape-secret "https://$tls_target/metrics" || true)
[ "$code" = 000 ] || fail "a scrape without a client certificate got $code"
code=$(curl -s -o /dev/null -w '%{http_code}' --max-time 5 "http://$tls_target/metrics" || true)
[ "$code" = 000 ] || fail "plain HTTP got $code"
echo "prometheus test: TLS scrape with certificate and user answered; wrong password and no user 401; no certificate and plain HTTP refused"

kill -TERM "$tls_pid"
wait "$tls_pid" || fail "serve with TLS exited with status $? on SIGTERM"
tls_pid=""
kill -TERM "$serve_pid"
wait "$serve_pid" || fail "serve exited with status $? on SIGTERM"
serve_pid=""
echo "prometheus test: passed (change to notification: SEL event $sel_time s, sensor past critical $sensor_time s, controller silent $silent_time s)"
