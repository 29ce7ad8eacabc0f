# Installing: accounts, units, permissions, and a daemon that runs.

files_of_the_machine() {
  inside_sh 'find / -xdev \( -path /proc -o -path /sys -o -path /dev -o -path /run -o -path /tmp \
      -o -path /srv/debs -o -path /var/cache/apt -o -path /var/lib/apt -o -path /var/log \) -prune -o -print;
    find /var -xdev \( -path /var/cache/apt -o -path /var/lib/apt -o -path /var/log \) -prune -o -print' |
    sort -u
}

no_dependency_on_a_desktop() {
  ! inside_sh 'dpkg -l' | grep -E '^ii +(libx11|libgtk|libqt|libgl1|libwayland)'
}

walk_install() {
  say "Installing the packages"
  files_of_the_machine > "$work/files.before"
  inside_sh 'dpkg -l | grep -c ^ii' > "$work/packages.before"
  show sh -c 'apt-get install -y --no-install-recommends /srv/debs/*.deb | tail -3'
  show sh -c 'dpkg -l "*spacekeep*" | tail -n +6'
  echo "  packages that came along: $(($(inside_sh 'dpkg -l | grep -c ^ii') - $(cat "$work/packages.before")))"
  check "the packages are installed and configured" inside_sh \
    '[ "$(dpkg-query -W -f="\${db:Status-Abbrev}\n" spacekeep spacekeep-services libspacekeep-dev python3-spacekeep | sort -u)" = "ii " ]'
  [ $failures = 0 ] || die "without the packages there is nothing to walk through"
  check "none of them brings a desktop" no_dependency_on_a_desktop
  check "the daemon runs and has told that it is ready" inside systemctl is-active spacekeepd.service
  check "its socket is open to everybody" inside_sh '[ "$(stat -c %a /run/spacekeep/spacekeep.sock)" = 666 ]'
  check "only root writes where services are reached" inside_sh \
    '[ "$(stat -c "%U %a" /run/spacekeep/services)" = "root 755" ]'
  check "the daemon cannot put another folder in its place" inside_sh \
    '[ "$(stat -c "%U %a" /run/spacekeep)" = "root 1775" ]'
  check "only the daemon reads its state" inside_sh \
    '[ "$(stat -c "%U %a" /var/lib/spacekeep)" = "_spacekeep 700" ]'
  check "the daemon and its socket come up with the machine" inside systemctl is-enabled spacekeepd.service spacekeepd.socket
  check "nothing of the packages has changed" inside dpkg --verify spacekeep spacekeep-services libspacekeep-dev python3-spacekeep
  check "a program in Python asks the daemon" inside_sh \
    'python3 -c "import spacekeep; print(spacekeep.Client().purgeable(\"/\"))" | grep -q SPACEKEEP_TOTAL_AVAILABLE'
}
