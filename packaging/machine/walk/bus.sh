# The daemon on the machine's system bus, under the policy that was installed.

bus_call() {
  local user=$1 method=$2 volume=$3
  inside runuser -u "$user" -- busctl call com.quorvel.Spacekeep /com/quorvel/Spacekeep \
    com.quorvel.SpacekeepClientProtocol "$method" 'a{sv}' 1 SPACEKEEP_VOLUME s "$volume"
}
bus_answers() { bus_call root clientPurgeableSpace /var | grep -q '^aa{sv} 1 '; }
bus_owner() {
  inside busctl call org.freedesktop.DBus /org/freedesktop/DBus org.freedesktop.DBus \
    GetConnectionUnixUser s com.quorvel.Spacekeep
}

walk_bus() {
  say "The daemon on the system bus"
  check "it has its name there" until_true 30 bus_owner
  check "the name is its account's" inside_sh \
    '[ "$(busctl call org.freedesktop.DBus /org/freedesktop/DBus org.freedesktop.DBus GetConnectionUnixUser s com.quorvel.Spacekeep)" = "u $(id -u _spacekeep)" ]'
  show busctl introspect com.quorvel.Spacekeep /com/quorvel/Spacekeep
  check "a query is answered" bus_answers
  check "who has no right is refused" inside_sh \
    'runuser -u nobody -- busctl call com.quorvel.Spacekeep /com/quorvel/Spacekeep com.quorvel.SpacekeepClientProtocol clientPurgeableSpace "a{sv}" 1 SPACEKEEP_VOLUME s /var 2>&1 | grep -q "Access denied"'
  check "nobody else takes the name" inside_sh \
    '! runuser -u nobody -- busctl call org.freedesktop.DBus /org/freedesktop/DBus org.freedesktop.DBus RequestName su com.quorvel.Spacekeep 0'
  check "what the policy does not name does not get through" inside_sh \
    '! busctl call com.quorvel.Spacekeep /com/quorvel/Spacekeep org.freedesktop.DBus.Properties GetAll s x'
  inside systemctl stop spacekeepd.service
  check "a call starts it" bus_answers
  check "and its socket is the one of the service manager" inside systemctl is-active spacekeepd.socket
  inside systemctl restart dbus.service
  check "it comes back to a bus that was restarted" until_true 60 bus_answers
  show journalctl -q --no-pager -o cat SYSLOG_IDENTIFIER=spacekeepd SPACEKEEP_OPERATION=SpacekeepBus
}
