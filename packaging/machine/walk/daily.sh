# The daily pass by the machine's clock. The second start of the machine has a boot clock that is 25
# hours ahead, given by the kernel (time_namespaces(7)); the daemon is the installed one.

runs() { inside_sh "journalctl -q -u spacekeepd SPACEKEEP_OPERATION=performPeriodicsWithInfo -o cat | wc -l"; }
recorded() { inside_sh 'stat -c %y /var/lib/spacekeep/com.quorvel.Spacekeep.daily.run'; }
record_is_newer_than() { [ "$(recorded)" != "$1" ]; }
pass_has_run() { [ "$(runs)" -gt "$1" ]; }

trace_without_delay() {
  # As an administrator would: an own launch file, here without the random delay, and tracing.
  inside_sh 'mkdir -p /etc/spacekeep/launch.d
    sed "s|<integer>3600</integer>|<integer>0</integer>|" /usr/lib/spacekeep/launch.d/com.quorvel.Spacekeep.daily.plist \
      > /etc/spacekeep/launch.d/com.quorvel.Spacekeep.daily.plist
    echo "<plist version=\"1.0\"><dict><key>LogLevel</key><integer>5</integer></dict></plist>" > /etc/spacekeep/log.plist
    mkdir -p /var/log/journal; systemctl restart systemd-journald'
}

walk_daily() {
  say "The daily pass"
  local first before clock
  trace_without_delay
  inside systemctl restart spacekeepd.service
  check "a machine that never had a run gets one" until_true 60 pass_has_run 0
  show sh -c 'journalctl -q -u spacekeepd SPACEKEEP_OPERATION=performPeriodicsWithInfo -o cat | head -4'
  first=$(runs)
  before=$(recorded)
  inside systemctl restart spacekeepd.service
  inside spacekeepctl query /var >/dev/null
  sleep 5
  check "a restart of the daemon brings no second one" test "$(runs)" = "$first"
  echo "  last run recorded $before"
  clock=$(inside cut -d. -f1 /proc/uptime)
  stop_machine
  start_machine 90000
  echo "  the boot clock said $clock s before and says $(inside cut -d. -f1 /proc/uptime) s now"
  check "the clock is 25 hours further" test "$(($(inside cut -d. -f1 /proc/uptime) - clock))" -ge 90000
  check "the daemon has come up with the machine" until_true 30 inside systemctl is-active spacekeepd.service
  check "the pass of the day has run" until_true 60 record_is_newer_than "$before"
  check "and asked the services of each volume" until_true 60 pass_has_run "$first"
  inside rm -r /etc/spacekeep
  inside systemctl restart spacekeepd.service
}
