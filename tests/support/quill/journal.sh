# Sourced by the sample product's control scripts and by the scripts of sample patches. The caller sets
# quill_home, the home without a trailing "/".
#
# shellcheck shell=sh disable=SC2154

# An account in a private view of /etc/passwd has no name here.
user_name() { id -un 2>/dev/null || true; }

# journal PROGRAM ARGUMENT...
# Appends one line to the home's journal: program, user, directory, PATH, QUILLHOME, arguments, separated by
# the unit separator, which occurs in none of them. Saves a copy of every watched file as it is at the moment
# of the call.
journal() {
  [ -z "${QUILL_UNJOURNALED-}" ] || return 0
  us=$(printf '\037')
  line="$1$us$(user_name)$us$(pwd)$us$PATH$us${QUILLHOME-}"
  call=$1
  shift
  for argument in "$@"; do
    line="$line$us$argument"
    call="$call [$argument]"
  done
  printf '%s\n' "$line" >>"$quill_home/journal"
  save_watched
  answer "$call"
}

# answer CALL: in a home with control/answers no instance is real. A call such as "QuillAgent [stop] [ox]" runs the
# shell text of this name there, if there is one, and that is all.
answer() {
  [ -d "$quill_home/control/answers" ] || return 0
  # shellcheck disable=SC1090
  [ ! -f "$quill_home/control/answers/$1" ] || . "$quill_home/control/answers/$1"
  exit 0
}

# save_watched: copies the files listed in control/watch to control/seen/<line of the journal>/.
save_watched() {
  [ -s "$quill_home/control/watch" ] || return 0
  seen="$quill_home/control/seen/$(wc -l <"$quill_home/journal" | tr -d ' ')"
  mkdir -p "$seen"
  while IFS= read -r watched; do
    if [ -f "$quill_home/$watched" ]; then
      mkdir -p "$(dirname "$seen/$watched")"
      cp -p "$quill_home/$watched" "$seen/$watched"
    fi
  done <"$quill_home/control/watch"
}
