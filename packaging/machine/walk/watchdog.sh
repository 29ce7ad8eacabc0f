# A service that never answers its ping holds the registry: the watchdog ends the daemon, and all is well again.

walk_watchdog() {
  say "A silent service wedges the registry"
  local before since=$SECONDS
  cp "$here/silent_service.py" "$root/srv/"
  before=$(property spacekeepd.service MainPID)
  check "it checks in and says nothing until the daemon goes" \
    inside timeout 150 python3 /srv/silent_service.py /run/spacekeep/spacekeep.sock 140
  check "the daemon is there again, as another process" until_true 30 inside_sh \
    "systemctl -q is-active spacekeepd && [ \$(systemctl show -p MainPID --value spacekeepd) != $before ]"
  echo "  the whole took $((SECONDS - since)) s"
  show sh -c 'journalctl -q -u spacekeepd -n 8 --no-pager -o cat'
  check "the service manager counts one restart" test "$(property spacekeepd.service NRestarts)" = 1
  check "the daemon had said why" inside_sh \
    "journalctl -q -u spacekeepd | grep -q \"the daemon's queues do not answer, the watchdog will end it\""
  check "a query is answered again" inside spacekeepctl query /var
  check "settings were kept" inside_sh 'spacekeepctl state get com.example.walk | grep -q kept'
}
