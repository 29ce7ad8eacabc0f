# The daemon under its service manager: started by its socket, without privileges, with the right volumes.

status_line() { inside_sh "grep -E '^$1:' /proc/\$(systemctl show -p MainPID --value spacekeepd)/status"; }

walk_daemon() {
  say "The daemon, started by its socket"
  inside systemctl stop spacekeepd.service 2>/dev/null
  check "it is down and its socket stays" inside_sh \
    '! systemctl -q is-active spacekeepd.service && systemctl -q is-active spacekeepd.socket'
  show spacekeepctl query /var
  check "the first call has started it" inside systemctl is-active spacekeepd.service
  show spacekeepctl volumes
  check "it has an account of its own" inside_sh \
    '[ "$(ps -o user:20= -C spacekeepd)" = _spacekeep ]'
  check "it has no capability" test "$(status_line CapEff | awk '{print $2}')" = 0000000000000000
  check "it cannot gain any" test "$(status_line NoNewPrivs | awk '{print $2}')" = 1
  check "its system calls are filtered" test "$(status_line Seccomp | awk '{print $2}')" = 2
  check "its network is empty" inside_sh \
    '[ "$(nsenter -t $(systemctl show -p MainPID --value spacekeepd) -n cat /proc/net/dev | tail -n +3 | awk "{print \$1}")" = lo: ]'
  check "no block device is in its sight" inside_sh \
    '[ -z "$(nsenter -t $(systemctl show -p MainPID --value spacekeepd) -m find /dev -type b)" ]'
  check "it writes its state under the sandbox" inside_sh \
    'spacekeepctl state set com.example.walk kept && spacekeepctl state get com.example.walk | grep -q kept'
  check "the folder of its device nodes is no volume to it" inside_sh \
    '! spacekeepctl query /dev'
  check "the journal has its fields" inside_sh \
    'journalctl -q -o json SYSLOG_IDENTIFIER=spacekeepd SPACEKEEP_CATEGORY=Spacekeep | grep -q SPACEKEEP_OPERATION'
  show sh -c 'systemd-analyze security --no-pager spacekeepd.service | grep -v ✓'
}
