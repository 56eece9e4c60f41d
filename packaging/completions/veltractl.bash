# bash completion for veltractl. Made from the program's own command line; do not change it by hand.
_veltractl() {
  local current=${COMP_WORDS[COMP_CWORD]} previous=${COMP_WORDS[COMP_CWORD - 1]} path="" words="" given=0 i
  for ((i = 1; i < COMP_CWORD; i++)); do
    case ${COMP_WORDS[i]} in
      --root | --input | --client-type | --session-id | --client-version | --client | --service | --user-info | --category | --type | --flag | --expect | --message | --backend | --last | -o | --output | --html) ((i++)) ; continue ;;
    esac
    case $path+${COMP_WORDS[i]} in
      +session | +send | +one-shot | +states | +display-url | +upload | +upload-log-data | +status | +metrics | +why | +watch | +config | /config+get | /config+set | /config+unset | +refresh | +report | +spool | /spool+list | /spool+send | /spool+drop | +doctor | +stats | +privacy | /privacy+off | /privacy+on | /privacy+reset-identifiers | +history | /history+show | /history+purge) path+=/${COMP_WORDS[i]} ;;
      *+-*) ;;
      *) ((given++)) ;;
    esac
  done
  COMPREPLY=()
  case $previous in
    --input | -o | --output | --html) compopt -o filenames; mapfile -t COMPREPLY < <(compgen -f -- "$current"); return ;;
    --root) compopt -o filenames; mapfile -t COMPREPLY < <(compgen -d -- "$current"); return ;;
    --root | --input | --client-type | --session-id | --client-version | --client | --service | --user-info | --category | --type | --flag | --expect | --message | --backend | --last | -o | --output | --html) return ;;
  esac
  case $path in
    "/session") words=" --aggregate --input --client-type --session-id --client-version --client --service --user-info --require-user-info --batch-events" ;;
    "/send") words=" --category --type --client-type --session-id --client-version --client --service --user-info --require-user-info --batch-events --flag --expect" ;;
    "/one-shot") words=" --category --type --client-type --session-id --client-version --client --service --user-info --require-user-info --batch-events" ;;
    "/states") words=" --client-type --session-id --client-version --client --service --user-info --require-user-info --batch-events" ;;
    "/display-url") words=" --client-type --session-id --client-version --client --service --user-info --require-user-info --batch-events" ;;
    "/upload") words=" --client-type --session-id --client-version --client --service --user-info --require-user-info --batch-events" ;;
    "/upload-log-data") words=" --client-type --session-id --client-version --client --service --user-info --require-user-info --batch-events" ;;
    "/status") words=" --watch" ;;
    "/metrics") words="" ;;
    "/why") words=" --message --client-type --session-id --client-version --category --type --flag --client --service --backend --uploads --last" ;;
    "/watch") words=" --message --client-type --session-id --client-version --category --type --flag --client --service --backend --uploads --contents" ;;
    "/config/get") words="" ;;
    "/config/set") words="" ;;
    "/config/unset") words="" ;;
    "/config") words=" get set unset" ;;
    "/refresh") words="" ;;
    "/report") words=" -o --output --yes" ;;
    "/spool/list") words="" ;;
    "/spool/send") words="" ;;
    "/spool/drop") words="" ;;
    "/spool") words=" list send drop" ;;
    "/doctor") words=" --client-type" ;;
    "/stats") words="" ;;
    "/privacy/off") words="" ;;
    "/privacy/on") words="" ;;
    "/privacy/reset-identifiers") words="" ;;
    "/privacy") words=" off on reset-identifiers" ;;
    "/history/show") words=" --raw" ;;
    "/history/purge") words="" ;;
    "/history") words=" --html show purge" ;;
    "") words=" --root --json --version -h --help session send one-shot states display-url upload upload-log-data status metrics why watch config refresh report spool doctor stats privacy history" ;;
  esac
  [[ $path == "" ]] || words+=" --root --json --version -h --help"
  if [[ $current != -* ]]; then
    case $path+$given in
    /config/get+0) words="DiagnosticLogSubmissionEnabled environmentType forceEventLogging httpsPostURL httpsRealtimePostURL uuidOverrideDNU uuidRespectDNU ReportingOff veltra_storebag_url com.florn.timed/TMAutomaticTimeZoneEnabled" ;;
    /config/set+0) words="DiagnosticLogSubmissionEnabled environmentType forceEventLogging httpsPostURL httpsRealtimePostURL uuidOverrideDNU uuidRespectDNU ReportingOff veltra_storebag_url com.florn.timed/TMAutomaticTimeZoneEnabled" ;;
    /config/unset+0) words="DiagnosticLogSubmissionEnabled environmentType forceEventLogging httpsPostURL httpsRealtimePostURL uuidOverrideDNU uuidRespectDNU ReportingOff veltra_storebag_url com.florn.timed/TMAutomaticTimeZoneEnabled" ;;
    esac
    case $path in
      /upload | /upload-log-data) compopt -o filenames; mapfile -t COMPREPLY < <(compgen -f -- "$current"); return ;;
    esac
  fi
  mapfile -t COMPREPLY < <(compgen -W "$words" -- "$current")
}
complete -F _veltractl veltractl
