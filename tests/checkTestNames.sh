#!/usr/bin/env bash
# Every ctest name readable and the same on every build and run: test programs
# list their tests twice, in separate processes (so heap addresses would
# differ), and each name must be words and case names only, no printed bytes.
# Usage: tests/checkTestNames.sh BUILD_DIR
set -euo pipefail
build=${1:?usage: checkTestNames.sh BUILD_DIR}
status=0

# Prefix/Fixture.Test/CaseName, each in UpperCamelCase (letters and digits);
# a case made of several parameters joins their names with '_'.
gtestName='^([A-Z][A-Za-z0-9]*/)?[A-Z][A-Za-z0-9]*\.[A-Z][A-Za-z0-9]*(/[A-Za-z0-9]+(_[A-Za-z0-9]+)*)?$'
# What a printed parameter leaves behind: byte dumps, addresses, spaces.
unreadable='byte object|GetParam|TypeParam|0x[0-9a-fA-F]{8,}|[0-9a-fA-F]{12,}|[<> #]'

mapfile -t programs < <(find "$build/tests" -maxdepth 2 -type f -name '*_tests' -perm -u+x | sort)
if [ ${#programs[@]} -eq 0 ]; then
  echo "no test programs under $build/tests" >&2
  exit 1
fi
# "Suite." lines, then "  Test  # GetParam() = ..." lines; the comment is not part of the name.
names() {
  "$1" --gtest_list_tests | awk '/^[^ ]/ { suite = $1; next } { print suite $1 }'
}
for program in "${programs[@]}"; do
  first=$(names "$program")
  second=$(names "$program")
  if [ "$first" != "$second" ]; then
    echo "$(basename "$program"): test names differ between two runs:" >&2
    diff <(echo "$first") <(echo "$second") >&2 || true
    status=1
  fi
  while IFS= read -r name; do
    if ! [[ $name =~ $gtestName ]]; then
      echo "$(basename "$program"): unreadable test name: $name" >&2
      status=1
    elif [[ $name =~ /[0-9]+$ ]]; then
      echo "$(basename "$program"): a parameterised test without a name generator: $name" >&2
      status=1
    fi
  done <<<"$first"
done

# And the names ctest itself registered, the lab's and the driver's included.
count=0
while IFS= read -r name; do
  count=$((count + 1))
  if [[ $name =~ $unreadable ]]; then
    echo "unreadable ctest name: $name" >&2
    status=1
  fi
done < <(ctest --test-dir "$build" -N | sed -n 's/^ *Test *#[0-9]*: //p')
echo "${#programs[@]} test programs and $count ctest names checked"
exit $status
