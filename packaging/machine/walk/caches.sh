# Real caches of the system, through the services that ship.

available() { inside_sh "df -B1 --output=avail $1 | tail -1" | tr -d ' '; }
archives() { inside_sh 'ls /var/cache/apt/archives/*.deb 2>/dev/null | wc -l'; }

# Log lines of a month ago, in archived files of the journal with the names that journald gives them.
fill_journal() {
  inside_sh 'mkdir -p /var/log/journal && systemctl restart systemd-journald && journalctl -q --flush
    for round in 1 2 3; do
      seq 1 20000 | sed "s/^/a line of the walk, as long as lines usually are, number /" | systemd-cat -t walk
      journalctl -q --sync; journalctl -q --rotate
    done'
}
age_journal() {
  # Rename as if their first entries were 40 days old: the age is that of the name (journald names).
  inside_sh 'cd /var/log/journal/*/ && for file in system@*.journal; do
      head=${file%-*-*}; rest=${file#"$head"-}
      old=$(printf %016x $((($(date +%s) - 40 * 86400) * 1000000)))
      mv "$file" "$head-${rest%-*}-$old.journal"
    done; ls'
}

walk_caches() {
  say "The caches of the machine"
  local before after count
  show sh -c 'systemctl list-units --no-pager --no-legend "spacekeep-service@*.socket"'
  check "each rule that is on is listened for" inside_sh \
    'for rule in $(grep -L ENABLED /usr/lib/spacekeep/rules/system/*.plist); do
       name=${rule##*/}; systemctl -q is-active "spacekeep-service@${name%.plist}.socket" || { echo "$name"; exit 1; }
     done'
  check "no service runs when nobody asks" until_true 90 inside_sh '! pgrep spacekeep-comm'
  show /usr/libexec/spacekeep/spacekeep-command --rules-dir /usr/lib/spacekeep/rules/system --estimate
  # What was asked for at a lower urgency must not answer from memory.
  inside spacekeepctl state unset SPACEKEEP_RECENT_SERVICE_STATS >/dev/null
  show sh -c 'spacekeepctl query /var --itemized --urgency 4'
  check "the archives of the package manager are counted" inside_sh \
    'spacekeepctl query /var --itemized --urgency 4 | grep -E "spacekeep.apt +[1-9][0-9.]+ MiB"'
  check "services have run under their sandbox" inside_sh \
    'journalctl -q -u "spacekeep-service@*" --no-pager | grep -q Started'
  before=$(available /var)
  count=$(archives)
  show spacekeepctl purge /var 40M --urgency 3
  check "what was downloaded today stays at urgency 3" test "$(archives)" = "$count"
  show spacekeepctl purge /var 40M --urgency 4
  # One purge asks each service for an equal share, and those that have nothing get theirs too; who
  # needs more asks again.
  purges=1
  until [ $(($(available /var) - before)) -ge 40000000 ] || [ $purges = 20 ]; do
    inside spacekeepctl purge /var 40M --urgency 4 >/dev/null 2>&1 || true
    purges=$((purges + 1))
  done
  echo "  purges: $purges"
  after=$(available /var)
  echo "  archives before: $count, after: $(archives); bytes gained on /var: $((after - before))"
  check "the volume has gained what was asked for" test $((after - before)) -ge 40000000
  check "not all of them went" test "$(archives)" -gt 0
  check "statistics appear" until_true 20 inside test -s /run/spacekeep/metrics.prom
  before=$(archives)
  # The lock of a package manager that is at work.
  inside_sh 'exec 9>>/var/lib/dpkg/lock-frontend; python3 -c "import fcntl,subprocess;fcntl.lockf(9,fcntl.LOCK_EX);subprocess.run([\"spacekeepctl\",\"purge\",\"/var\",\"500M\",\"--urgency\",\"4\"])"' >/dev/null || true
  check "while the package manager works its archives stay" test "$(archives)" = "$before"

  fill_journal >/dev/null 2>&1
  age_journal >/dev/null
  show sh -c 'du -sh /var/log/journal'
  before=$(inside_sh 'du -sB1 /var/log/journal | cut -f1')
  show spacekeepctl purge /var 10M --urgency 2
  after=$(inside_sh 'du -sB1 /var/log/journal | cut -f1')
  echo "  the journal: $before bytes before, $after after"
  check "archived log files older than a month went at urgency 2" test "$after" -lt "$before"
  check "the log goes on" inside_sh 'logger -t walk "still here" && journalctl -q --sync && journalctl -q -t walk -n 1 -o cat | grep -q "still here"'
}
