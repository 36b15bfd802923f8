# The part of scripts/demo that shows orvpatchctl; it is read by that script, whose functions it uses.
#
# shellcheck shell=bash
# shellcheck disable=SC2154  # home is that of scripts/demo

# tree: everything in the home but what evidence is kept of: name, mode, owner, time, size and content.
tree() {
  find "$home" -path "$home/patchlogs" -prune -o -path "$home/control" -prune -o -path "$home/journal" -prune -o \
    ! -name RunInfo ! -type d -printf '%P %m %u %T@ %s ' -exec sha256sum {} \; | sed "s|$home||" | sort
}

chmod 700 "$home/tmp"
chmod 644 "$home/config/.ConfigData/RunInfo"

heading "A patch is made: a source tree, and an archive of it as one might pack it"
shown 0 "see patch.ini" orvpatchctl new tree --product kum --level 06.10.00.03 --name fixpack3 --description "Fix pack 3"
install -D -m 755 /dev/stdin tree/updated_files/lpp266/um/bin/kum <<<"level 06.10.00.03"
sed -i 's/10-prepare.sh/10_prepare.sh/' tree/patch.ini
mkdir shipped
tar -cf shipped/kum_lpp266_vema_fp0003.tar -C tree .

heading "What is wrong with it?"
shown 1 'the descriptor is named "./patch.ini"' orvpatchctl lint shipped
rm shipped/*

heading "A build packs it right, and holds it against the same rules: the command in patch.ini is misspelt"
shown 1 "10_prepare.sh" orvpatchctl build tree -o shipped
same "files after a build that found errors" "" "$(ls shipped)"
sed -i 's/10_prepare.sh/10-prepare.sh/' tree/patch.ini
shown 0 "kum_lpp266_vema_fp0003.tar" orvpatchctl build tree -o shipped
shown 0 "06.10.00.03" orvpatchctl show shipped/kum_lpp266_vema_fp0003.tar

heading "Will it go through on this host?"
shown 0 "0 errors, 0 warnings" orvpatchctl check "$home" shipped

heading "A later patch, whose last command fails after the files were replaced"
sed -e 's/= 03/= 04/; s/fixpack3/fixpack4/; s/Fix pack 3/Fix pack 4/' -i tree/patch.ini
printf '\n[PostCommands]\n20-convert.sh\n' >>tree/patch.ini
install -m 755 /dev/stdin tree/20-convert.sh <<<$'#!/bin/sh\necho "no space left for the conversion" >&2\nexit 3'
echo "level 06.10.00.04" >tree/updated_files/lpp266/um/bin/kum
echo "What is new in fix pack 4" >tree/updated_files/lpp266/um/whatsnew.txt
mkdir failing
shown 0 "kum_lpp266_vema_fp0004.tar" orvpatchctl build tree -o failing --fixpack fp0004
before=$(tree)
running=$(names)
shown 3 "failed" orvpatchctl apply "$home" failing --yes
same "the program that was installed" "level 06.10.00.04" "$(cat "$home/lpp266/um/bin/kum")"

heading "Back to the home before: every file with its mode, owner and time, and the agents run"
shown 0 "undone" orvpatchctl undo "$home"
same "the home" "$before" "$(tree)"
same "running instances" "$running" "$(names)"
shown 0 "FAIL, undone" orvpatchctl history "$home"

heading "The patch of before goes in, and is still what was installed"
shown 0 "applied" orvpatchctl apply "$home" shipped --yes
record=$(find "$home/patchlogs/transactions" -name record.html -newer failing | sort | tail -n 1)
transaction=$(basename "$(dirname "$record")")
shown 0 "0 differences" orvpatchctl verify "$home" --transaction "$transaction"

heading "Each transaction left a record, for a program and for a reader: what was shown above, with all steps"
shown 0 '"verdict": "undone"' grep -h -E '^ "(id|action|undoes|started|ended|verdict)":' \
  "$home"/patchlogs/transactions/*/record.json
shown 0 "record.html" find "$home/patchlogs/transactions" -name 'record.*' -printf '%P\n'
