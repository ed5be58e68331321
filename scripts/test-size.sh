#!/usr/bin/env bash
# Prints the size of the tests against the size of the product: lines of C and C++ (.c, .cpp,
# .h) that are neither blank nor comment, tests/ against platform/, upload-common/,
# upload-svc/ and tools/ (bench/ and scripts/ count on neither side). Code that only tests use
# counts as tests wherever it lives: a file under tools/ or a product folder whose first line
# is the comment "// test support" moves to the tests' side.
# --max R: exits 1 when the ratio passes R.
set -euo pipefail
cd "$(dirname "$0")/.."

max=""
if [ "${1:-}" = "--max" ] && [ -n "${2:-}" ]; then
  max="$2"
fi

# Lines of code in the files given on standard input: comments (// and /* */, as the
# preprocessor reads them outside strings) and blank lines do not count.
count() {
  local total=0 n f
  while IFS= read -r f; do
    n=$(gcc -fpreprocessed -dD -E -P -x c++ "$f" 2>/dev/null | grep -cv '^[[:space:]]*$' || true)
    total=$((total + n))
  done
  echo "$total"
}

sources() { find "$@" -type f \( -name '*.c' -o -name '*.cpp' -o -name '*.h' \) | sort; }
is_support() { head -n1 "$1" | grep -qx '// test support'; }

product_files=() support_files=()
while IFS= read -r f; do
  if is_support "$f"; then support_files+=("$f"); else product_files+=("$f"); fi
done < <(sources platform upload-common upload-svc tools)

tests=$( { sources tests; printf '%s\n' "${support_files[@]+"${support_files[@]}"}" | sed '/^$/d'; } | count)
product=$(printf '%s\n' "${product_files[@]}" | count)
ratio=$(awk -v t="$tests" -v p="$product" 'BEGIN { printf "%.3f", t / p }')
echo "tests:   $tests lines (tests/ and ${#support_files[@]} support files elsewhere)"
echo "product: $product lines (platform/ upload-common/ upload-svc/ tools/)"
echo "ratio:   $ratio"
if [ -n "$max" ] && awk -v r="$ratio" -v m="$max" 'BEGIN { exit !(r > m) }'; then
  echo "the tests pass $max of the product's size" >&2
  exit 1
fi
