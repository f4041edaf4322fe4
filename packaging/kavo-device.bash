# bash completion for kavo-device
_kavo_device() {
  local words=("${COMP_WORDS[@]:0:COMP_CWORD+1}") program
  words=("${words[@]//\\/}")  # as the shell would read them
  words=("${words[@]#[\"\']}")
  program=$(readlink -f "$(type -P "${words[0]}")") || return
  mapfile -t COMPREPLY < <("${program%/*}/complete" "${words[@]}")
  compopt -o filenames
  [[ ${#COMPREPLY[@]} -eq 1 && ${COMPREPLY[0]} == */ ]] && compopt -o nospace
}
complete -o default -F _kavo_device kavo-device
