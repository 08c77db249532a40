# shellcheck shell=bash
# Sourced by scripts that run Windows programs. ensure_wine_prefix creates the Wine prefix named
# by WINEPREFIX if it is missing, its parent folder included (Wine refuses a prefix whose parent
# does not exist), and answers 1 with a message when no prefix results. It must run before Windows
# programs start in parallel: two first starts race to create the prefix and its server folder.
ensure_wine_prefix() {
  [ -d "$WINEPREFIX" ] && return 0
  echo "== creating the Wine prefix $WINEPREFIX"
  mkdir -p "$(dirname "$WINEPREFIX")"
  wineboot -i >/dev/null 2>&1 </dev/null || wine wineboot -i >/dev/null 2>&1 </dev/null
  [ -d "$WINEPREFIX" ] || { echo "FAILED: Wine did not create the prefix $WINEPREFIX"; return 1; }
}
