#!/usr/bin/env bash
# Makes the README's Speed table again from bench/speed-record.md, which bench/compare_peers.sh writes: the
# lines between the two speed-record markers of README.md are replaced by the record. A test holds the two
# to the same text.
set -euo pipefail
root=$(cd "$(dirname "$0")/.." && pwd)
readme=$root/README.md
record=$root/bench/speed-record.md
begin='<!-- speed record: made from bench/speed-record.md by bench/update_readme_speed.sh -->'
end='<!-- end of speed record -->'
grep -qxF "$begin" "$readme" && grep -qxF "$end" "$readme" ||
  { echo "update_readme_speed: README.md lacks the speed record markers" >&2; exit 1; }
[ -s "$record" ] || { echo "update_readme_speed: $record is missing or empty" >&2; exit 1; }
updated=$(mktemp "$root/.README.md.XXXXXX")
trap 'rm -f "$updated"' EXIT
awk -v begin="$begin" -v end="$end" -v record="$record" '
  $0 == begin { print; while ((getline line < record) > 0) print line; skipping = 1; next }
  $0 == end { skipping = 0 }
  !skipping { print }' "$readme" >"$updated"
chmod --reference="$readme" "$updated"
mv "$updated" "$readme"
trap - EXIT
