# SPDX-License-Identifier: Apache-2.0
# Completion of ldappw for bash: verbs and options are those of the command's own help, all else is a file.
_ldappw() {
  local current=${COMP_WORDS[COMP_CWORD]} verb=() word help
  for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
    [[ ${#verb[@]} -lt 1 || ( ${verb[0]} == keys && ${#verb[@]} -lt 2 ) ]] || break
    [[ $word == -* ]] || verb+=("$word")
  done
  help=$("${COMP_WORDS[0]}" "${verb[@]}" --help 2>/dev/null) || return
  COMPREPLY=()
  if [[ $current == -* ]]; then
    help=$(sed -n 's/^  \(-h,\)\{0,1\}\(--[a-z-]*\).*/\2/p' <<<"$help")
    mapfile -t COMPREPLY < <(compgen -W "$help" -- "$current")
  elif [[ $help == *Subcommands:* ]]; then
    help=$(sed -n '/^Subcommands:/,/^$/s/^  \([a-z]*\).*/\1/p' <<<"$help")
    mapfile -t COMPREPLY < <(compgen -W "$help" -- "$current")
  fi
}
complete -o default -F _ldappw ldappw
