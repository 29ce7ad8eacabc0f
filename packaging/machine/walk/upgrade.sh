# A newer version over the installed one.

# The same packages with a higher version: what an upgrade does to a machine is up to the scripts.
make_newer() {
  local deb folder
  rm -rf "$work/newer" "$root/srv/newer"
  mkdir -p "$work/newer" "$root/srv/newer"
  for deb in "$root/srv/debs/"*.deb; do
    folder=$work/newer/$(basename "$deb" .deb)
    dpkg-deb -R "$deb" "$folder"
    sed -i -E 's/^(Version: .*)$/\1+later/; s/\(= ([^)]*)\)/(= \1+later)/' "$folder/DEBIAN/control"
    dpkg-deb -b --root-owner-group "$folder" "$root/srv/newer/" >/dev/null
  done
}

walk_upgrade() {
  say "Upgrading"
  local process socket
  make_newer
  process=$(property spacekeepd.service MainPID)
  socket=$(inside stat -c %i /run/spacekeep/spacekeep.sock)
  inside_sh 'mkdir -p /etc/spacekeep; echo "<plist version=\"1.0\"><dict><key>LogLevel</key><integer>4</integer></dict></plist>" > /etc/spacekeep/log.plist'
  show sh -c 'apt-get install -y --no-install-recommends /srv/newer/*.deb | tail -3'
  check "the newer version is there" inside_sh 'dpkg-query -W -f "\${Version}" spacekeep | grep -q "+later$"'
  check "the daemon runs as a new process" inside_sh \
    "systemctl -q is-active spacekeepd && [ \$(systemctl show -p MainPID --value spacekeepd) != $process ]"
  check "its socket was never gone" test "$(inside stat -c %i /run/spacekeep/spacekeep.sock)" = "$socket"
  check "settings were kept" inside_sh 'spacekeepctl state get com.example.walk | grep -q kept'
  check "what the administrator wrote was kept" inside grep -q LogLevel /etc/spacekeep/log.plist
}
