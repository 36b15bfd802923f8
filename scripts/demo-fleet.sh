# The part of scripts/demo that shows the collection for ansible-core with two homes of this machine in place of two
# hosts; it is read by that script, whose functions it uses.
#
# shellcheck shell=bash
# shellcheck disable=SC2154  # checkout, folder, home and sample are those of scripts/demo

"$checkout/scripts/setup" fleet
mkdir archive
"$checkout/packaging/collection" archive

second=$folder/second
trap '"$sample" stop "$second"; clean_up' EXIT
mkdir "$second" user
"$sample" make "$second"
for one in "$home" "$second/home"; do chmod 700 "$one/tmp" && chmod 644 "$one/config/.ConfigData/RunInfo"; done
level() { sed -n 's/^VRMF = //p' "$1/registry/ynlpp266.ver"; }

export HOME=$folder/user ANSIBLE_LOCALHOST_WARNING=false ANSIBLE_NOCOWS=1 ANSIBLE_FORCE_COLOR=0
export ANSIBLE_DISPLAY_OK_HOSTS=no ANSIBLE_DISPLAY_SKIPPED_HOSTS=no LC_ALL=C.UTF-8

heading "The collection is installed from its archive, and two hosts are written down"
shown 0 "installed successfully" ansible-galaxy collection install --offline archive/*.tar.gz
cat >hosts.yml <<END
all:
  hosts:
    first: {fixpack_home: $home}
    second: {fixpack_home: $second/home}
  vars:
    ansible_connection: local
    ansible_python_interpreter: /usr/bin/python3
    fixpack_orvpatchctl: $(command -v orvpatchctl)
END
shown 0 "second:" cat hosts.yml

heading "A fix pack with its checksums"
mkdir shipped
cp fixpack2/kyn_lpp266_vema_fp0002.tar shipped
(cd shipped && sha256sum -- *.tar >SHA256SUMS)
shown 0 "kyn" cat shipped/SHA256SUMS
fleet=(-i hosts.yml -e fixpack_source="$folder/shipped" -e fixpack_report="$folder/reports")

heading "One home refuses: nothing is changed anywhere"
chmod 777 "$second/home/tmp"
shown 2 "home-tmp" ansible-playbook orv.patch.rollout "${fleet[@]}"
chmod 700 "$second/home/tmp"
same "levels" "06100000 06100000" "$(level "$home") $(level "$second/home")"

heading "The rollout: the first home as the canary, then the other one"
shown 0 "changed: [second]" ansible-playbook orv.patch.rollout "${fleet[@]}"
same "levels" "06100002 06100002" "$(level "$home") $(level "$second/home")"

heading "Once more: nothing is left to do"
shown 0 "changed=0" ansible-playbook orv.patch.rollout "${fleet[@]}"
same "changed homes" "" "$(grep -E 'changed=[1-9]' output || true)"

heading "The report: a page, and the same for programs"
shown 0 "first" cut -d, -f 1,3-8 reports/fleet.csv
shown 0 "fleet.html" ls "$folder/reports/fleet.html"

heading "And back"
shown 0 "changed: [second]" ansible-playbook orv.patch.undo "${fleet[@]}"
same "levels" "06100000 06100000" "$(level "$home") $(level "$second/home")"
