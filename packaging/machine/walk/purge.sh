# Removing leaves the state, purging leaves nothing.

walk_purge() {
  say "Removing"
  show sh -c 'apt-get remove -y spacekeep spacekeep-services libspacekeep-dev python3-spacekeep | tail -3'
  check "the daemon is gone, and its socket" inside_sh \
    '! pgrep spacekeep && [ ! -e /run/spacekeep/spacekeep.sock ]'
  check "no unit of it is left" inside_sh '[ -z "$(systemctl list-units --all --no-legend "spacekeep*" | grep -v not-found)" ]'
  check "its state stays for the next installation" inside test -s /var/lib/spacekeep/com.quorvel.spacekeep.sqlite
  say "Purging"
  inside rm -r /etc/spacekeep   # the administrator's own
  show sh -c 'apt-get purge -y spacekeep spacekeep-services | tail -3'
  inside_sh 'apt-get autoremove -y --purge >/dev/null'
  files_of_the_machine > "$work/files.after"
  comm -13 "$work/files.before" "$work/files.after" > "$work/files.left"
  # Not of the packages: accounts stay by design, and these files note what was done.
  grep -vE '^/etc/(passwd|group|shadow|gshadow|subuid|subgid)-?$|^/etc/\.pwd\.lock$|^/var/lib/(dpkg|systemd)/|^/var/backups|^/var/cache/(ldconfig|debconf)|^/home|^/var/mail|^/srv/|^/var/tmp/systemd-private-|^/etc/systemd/system$' \
    "$work/files.left" > "$work/files.ours" || true
  sed 's/^/  left: /' "$work/files.ours"
  check "no file is left that was not there before" test ! -s "$work/files.ours"
  check "no unit is left that failed" inside_sh '[ -z "$(systemctl --failed --no-legend | grep spacekeep)" ]'
}
