# The client state and queries against bare sd-bus. Sourced by inside.

memory_services=1000
fresh_rounds=7

# Services of five users in five processes, because one user may not have a thousand connections.
# start_services NAME COUNT SOCKET; adds to the array `services`.
start_services() {
  local name=$1 count=$2 at=$3 user
  [ -p /tmp/hold ] || mkfifo /tmp/hold
  for user in 1 2 3 4 5; do
    setpriv --reuid=$((4000 + user)) --regid=$((4000 + user)) --clear-groups \
      /programs/bench/bench-many-services "user$user" $((count / 5)) "$at" \
      <>/tmp/hold >"/tmp/services-$name-$user" 2>&1 &
    services+=($!)
  done
  for user in 1 2 3 4 5; do wait_for grep -q "all serving" "/tmp/services-$name-$user"; done
}

end_services() {
  kill "${services[@]}" 2>/dev/null || true
  wait "${services[@]}" 2>/dev/null || true
  services=()
}

# start_peer NAME PROGRAM ARGUMENTS...; leaves the process in `peer` and its socket in /tmp/NAME.sock
start_peer() {
  local name=$1
  shift
  rm -f "/tmp/$name.sock"
  "$@" &
  peer=$!
  wait_for test -S "/tmp/$name.sock"
}

end_peer() {
  kill "$peer"
  wait "$peer" 2>/dev/null || true
}

pin() {
  local process
  for process in "${@:2}"; do taskset -a -c -p "$1" "$process" >/dev/null; done
}

# compare_calls KIND ROUNDS SUFFIX: on one processor, then with the client apart from the peers.
compare_calls() {
  local kind=$1 rounds=$2 suffix=$3
  pin 0 "$daemon" "$peer"
  echo "$kind$suffix, one processor:"
  taskset -c 0 /programs/bench/bench-small-call "$socket" /tmp/floor.sock "$kind" "$rounds" |
    sed -E "s/^(figure [a-z_]+)_p/\1${suffix}_p/"
  [ "$(nproc)" -ge 2 ] || return 0
  pin 1 "$daemon" "$peer"
  echo "$kind$suffix, two processors:"
  taskset -c 0 /programs/bench/bench-small-call "$socket" /tmp/floor.sock "$kind" "$rounds" |
    sed -E "s/^(figure [a-z_]+)_p/\1${suffix}_apart_p/"
}

bench_state() {
  start_peer floor /programs/bench/bench-bare-peer /tmp/floor.sock
  compare_calls state 40 ""
  head -c 61440 /dev/zero | tr '\0' x >/tmp/large
  /programs/bench/bench-set-text "$socket" LARGE_STATE_VALUE /tmp/large
  compare_calls state 40 _beside_60_kib
  end_peer
}

bench_query_from_memory() {
  services=()
  start_services memory "$memory_services" "$socket"
  start_peer floor /programs/bench/bench-bare-peer /tmp/floor.sock "$memory_services"
  taskset -c 0 /programs/bench/bench-small-call "$socket" /tmp/floor.sock query 0 >/dev/null || true
  sleep 2  # the memory is on the disk
  compare_calls query 20 ""
  end_peer
  end_services
}

# compare_fresh COUNT CLIENT_AND_SERVICES_CPU ASKERS_CPU
compare_fresh() {
  pin "$2" "${services[@]}"
  pin "$3" "$daemon" "$peer"
  taskset -c "$2" /programs/bench/bench-fresh-query "$socket" /tmp/asker.sock "$1" "$fresh_rounds"
}

# One daemon and one set of services for each number, so that nothing is left of the one before.
bench_fresh_queries() {
  local count
  : >/tmp/points
  for count in 10 30 100 300 1000; do
    services=()
    start_peer asker /programs/bench/bench-bare-asker /tmp/asker.sock
    start_services fresh "$count" "$socket"
    start_services bare "$count" /tmp/asker.sock
    echo "asked afresh, $count services, one processor:"
    compare_fresh "$count" 0 0 | tee /tmp/fresh || echo "void rounds"
    grep ^point /tmp/fresh >>/tmp/points || true
    [ "$count" != 1000 ] || fresh_figures query_asked_afresh
    if [ "$(nproc)" -ge 2 ]; then
      echo "asked afresh, $count services, two processors:"
      compare_fresh "$count" 0 1 | tee /tmp/fresh || echo "void rounds"
      [ "$count" != 1000 ] || fresh_figures query_asked_afresh_apart
    fi
    end_peer
    end_services
    restart_daemon
  done
  slope_figure
}

fresh_figures() {
  awk -v name="$1" '
    $1 == "ratio" && $2 == "one_by_one" {print "figure", name "_ratio", $3, 2}
    $1 == "ratio" && $2 == "all_at_once" {print "figure", name "_over_asking_all_first", $3, "-"}
    $1 == "services" {missing += $NF}
    END {print "figure", name "_missing", missing + 0, 0}' /tmp/fresh
}

# Least squares of log(time) over log(services); the error is the standard error of the slope.
slope_figure() {
  awk '{n++; x = log($2); y = log($3); xs[n] = x; ys[n] = y; sx += x; sy += y; sxx += x * x; sxy += x * y
        printf "%d services: %.0f us, %.1f us each\n", $2, $3, $3 / $2
        if (n > 1) printf "  slope since the point before: %.2f\n", (ys[n] - ys[n-1]) / (xs[n] - xs[n-1])}
       END {slope = (n * sxy - sx * sy) / (n * sxx - sx * sx); base = (sy - slope * sx) / n
            for (i = 1; i <= n; i++) rest += (ys[i] - base - slope * xs[i]) ^ 2
            error = sqrt(rest / (n - 2) / (sxx - sx * sx / n))
            printf "slope of log(time) over log(services): %.3f +- %.3f\n", slope, error
            printf "figure query_slope_over_services %.3f 1.0\n", slope}' /tmp/points
}
