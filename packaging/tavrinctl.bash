# Completion of tavrinctl's commands, options and settings. The program's own help says what there is.

# Prints the words of a help text: the commands and the options in it.
_tavrinctl_words() {
  awk '/^Subcommands:/ { commands = 1; next } /^$/ { commands = 0 } commands && /^  [a-z]/ { print $1 }
       /^ +-/ { gsub(/\{[^}]*\}/, "", $1); gsub(",", "\n", $1); print $1 }' <<<"$1"
}

_tavrinctl() {
  local program=${COMP_WORDS[0]} current=${COMP_WORDS[COMP_CWORD]} words command=() word
  words=$(_tavrinctl_words "$("$program" --help 2>/dev/null)")
  for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
    if [[ $word == [a-z]* && $word != help && $'\n'$words$'\n' == *$'\n'$word$'\n'* ]]; then
      command+=("$word")
      words=$(_tavrinctl_words "$("$program" "${command[@]}" --help 2>/dev/null)")
    fi
  done
  case ${command[*]} in
    'defaults read' | 'defaults write' | 'defaults delete')
      words+=$'\n'$("$program" defaults list 2>/dev/null | awk '/^[A-Za-z]/ { print $1 }') ;;
  esac
  # Without a match, Readline completes file names.
  mapfile -t COMPREPLY < <(compgen -W "$words" -- "$current")
}
complete -o default -F _tavrinctl tavrinctl
