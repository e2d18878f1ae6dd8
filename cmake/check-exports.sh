#!/usr/bin/env bash
# Fails when the dynamic symbol table of the shared library is not the public interface: every
# defined symbol must carry the version node and name a C function, or a declaration of the
# namespace WEZO::FILEINDEX (with its classes' type information), whose names all appear in the
# public headers; and every class and function that the headers mark FILEINDEX_EXPORT must be
# there.
#
# usage: check-exports.sh LIBRARY HEADER_DIR VERSION_NODE
set -euo pipefail

lib=$1
headers=$2
node=$3

# Every word of the public headers, once.
words=$(cat "$headers"/*.h | grep -oE '[A-Za-z_][A-Za-z0-9_]*' | sort -u)
declared() { grep -qxF -- "$1" <<<"$words"; }

symbols=$(nm -D --defined-only -C --with-symbol-versions "$lib" | cut -d' ' -f3-)
[ -n "$symbols" ] || { echo "no dynamic symbols in $lib" >&2; exit 1; }

bad=0
while IFS= read -r sym; do
  [ "$sym" = "$node" ] && continue
  name=${sym%@@"$node"}
  if [ "$name" = "$sym" ]; then
    echo "not in version node $node: $sym"
    bad=1
    continue
  fi
  for prefix in 'typeinfo name for ' 'typeinfo for ' 'vtable for '; do
    name=${name#"$prefix"}
  done
  # The qualified name without parameters, ABI tags and qualifiers.
  name=${name%%(*}
  name=${name//\[abi:cxx11\]/}
  if [[ $name == WEZO::FILEINDEX::* ]]; then
    name=${name#WEZO::FILEINDEX::}
  elif [[ $name == *:* || $name == *' '* ]]; then
    echo "outside the public namespace: $sym"
    bad=1
    continue
  fi
  IFS=':' read -ra parts <<<"${name//::/:}"
  for part in "${parts[@]}"; do
    if ! declared "${part#\~}"; then
      echo "not declared in $headers: $sym"
      bad=1
      break
    fi
  done
done <<<"$symbols"

# The other way round: each exported class has members in the table, each exported function or
# variable is there by name.
exported=$(cat "$headers"/*.h | grep -v '#define' |
  sed -nE 's/.*class FILEINDEX_EXPORT ([A-Za-z_][A-Za-z0-9_]*).*/\1::/p;
            s/^FILEINDEX_EXPORT [^(;]*[^A-Za-z0-9_]([A-Za-z_][A-Za-z0-9_]*)[(;].*/\1/p')
[ -n "$exported" ] || { echo "no FILEINDEX_EXPORT declaration in $headers" >&2; exit 1; }
for name in $exported; do
  if ! grep -qE "(^|::)${name}([(@]|$)|::${name}" <<<"$symbols"; then
    echo "declared FILEINDEX_EXPORT but not exported: $name"
    bad=1
  fi
done

if [ "$bad" -ne 0 ]; then
  echo "$lib exports more than its public headers declare" >&2
  exit 1
fi
echo "$(wc -l <<<"$symbols") dynamic symbols, all public and in $node"
