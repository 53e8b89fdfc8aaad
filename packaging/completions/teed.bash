# Completion of teed for bash.
_teed() {
  local current=${COMP_WORDS[COMP_CWORD]} options=
  COMPREPLY=()
  options='-h --help --version --state --socket --socket-mode --trace --keep-trace --max-connections --max-sessions'
  options+=' --max-memory'
  case ${COMP_WORDS[COMP_CWORD - 1]} in
    --state) compopt -o filenames && mapfile -t COMPREPLY < <(compgen -d -- "$current") ;;
    --socket) compopt -o filenames && mapfile -t COMPREPLY < <(compgen -f -- "$current") ;;
    --trace | --keep-trace) mapfile -t COMPREPLY < <(compgen -W 'error info debug' -- "$current") ;;
    --socket-mode | --max-*) ;;
    *) mapfile -t COMPREPLY < <(compgen -W "$options" -- "$current") ;;
  esac
}
complete -F _teed teed
