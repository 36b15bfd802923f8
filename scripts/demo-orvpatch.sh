# The part of scripts/demo that shows orvpatch; it is read by that script, whose functions it uses.
#
# shellcheck shell=bash
# shellcheck disable=SC2154  # sample, home and running are those of scripts/demo

heading "What would this patch do?"
shown 0 "    east instance of Monitoring Agent" orvpatch -h "$home" -t fixpack2/kyn_lpp266_vema_fp0002.tar
same "running instances after a report" "$running" "$(names)"

heading "A patch of the monitoring server is refused while the server runs"
shown 35 "must be stopped before the updates" orvpatch -h "$home" -i fixpack2/kqa_lpp266_vems_fp0002.tar

heading "The server is stopped, and a directory of patches is installed"
before=$(levels)
processes=$(instances)
"$home/bin/QuillServer" stop ""
shown 0 "Command completed successfully." orvpatch -h "$home" -i fixpack2
"$home/bin/QuillServer" start ""
paste -d : <(echo "$before") <(levels) | awk -F: '{ printf "    %-42s%s ->%s\n", $1, $2, $4 }'
same "levels of fix pack 2" 6 "$(levels | grep -c ': 06100002$')"
same "programs of fix pack 2" 6 "$(cat "$home"/lpp266/*/bin/* | grep -c 'level 06.10.00.02$')"
echo "The agents run again, as new processes:"
instances | indented
same "running instances" "$running" "$(names)"
same "processes that survived" "" "$(comm -12 <(sort <<<"$processes") <(instances | sort))"
shown 0 "kyn | lpp266 | vema" cat "$home/patchlogs/patches.hist"
same "records of the history" 6 "$(grep -c '| PASS |' output)"

heading "An older patch is refused"
shown 11 "Can't install backlevel patch version" orvpatch -h "$home" -i single/kyn_lpp266_vema_fp0001.tar

heading "A command of a patch fails after the agents were stopped"
before=$(levels)
shown 21 "Bad return code from 10_convert_data.sh: 3" orvpatch -h "$home" -i single/kum_lpp266_vema_fp0003.tar
shown 0 "no space left for the conversion" grep -A 2 "^ERROR.*10_convert_data" "$home/patchlogs/orvpatch.log"
echo "No file was replaced. The patched agent is still stopped, the OS agent was started again:"
instances | indented
same "running instances" "$(grep -v 'Files and Sockets' <<<"$running")" "$(names)"
same "levels after a failure" "$before" "$(levels)"
shown 0 "| FAIL |" tail -n 1 "$home/patchlogs/patches.hist"
