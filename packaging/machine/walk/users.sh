# Caches of a user, by a service that runs as that user.

alice() {
  inside runuser -u alice -- env XDG_RUNTIME_DIR=/run/user/1000 PATH=/usr/sbin:/usr/bin:/sbin:/bin "$@"
}

walk_users() {
  say "A user's caches"
  inside_sh 'useradd -m -u 1000 -s /bin/bash alice
    runuser -u alice -- sh -c "mkdir -p ~/.cache/thumbnails/normal ~/.cache/pip &&
      for n in \$(seq 1 40); do head -c 500000 /dev/urandom > ~/.cache/thumbnails/normal/\$n.png; done &&
      find ~/.cache/thumbnails -name \"*.png\" -exec touch -a -m -d \"200 days ago\" {} +"'
  inside loginctl enable-linger alice
  until_true 30 inside test -S /run/user/1000/systemd/private || true
  check "who has no right cannot even connect" fails alice_query
  check "her service does not run without the right" fails alice_service_runs
  inside_sh 'usermod -aG spacekeep-services alice; systemctl restart user@1000.service'
  check "with the group it does, from the next login on" until_true 30 alice_service_runs
  show runuser -u alice -- env XDG_RUNTIME_DIR=/run/user/1000 systemctl --user --no-pager status spacekeep-caches.service
  check "it has checked in under her number" until_true 20 inside_sh \
    'spacekeepctl --json query / --itemized --urgency 4 | grep -q "\.1000\""'
  show spacekeepctl query / --itemized --urgency 4
  check "she may ask how much there is" alice_query
  check "but not have it freed" fails alice_purge
  show spacekeepctl purge / 15M --urgency 2
  echo "  thumbnails left: $(inside_sh 'ls ~alice/.cache/thumbnails/normal | wc -l') of 40"
  check "old thumbnails of hers went" inside_sh '[ $(ls ~alice/.cache/thumbnails/normal | wc -l) -lt 40 ]'
}
alice_query() { alice spacekeepctl query /; }
alice_purge() { alice spacekeepctl purge / 1M; }
alice_service_runs() { alice systemctl --user -q is-active spacekeep-caches.service; }
