#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# The library's dynamic symbol table defines the three C functions and
# nothing else.
set -eu
got=$(nm -D --defined-only "$1" | awk '{print $3}' | sort)
want=$(printf '%s\n' punctuator_do_it punctuator_init punctuator_relese)
if [ "$got" != "$want" ]; then
  printf 'exported symbols differ:\n%s\n' "$got" >&2
  exit 1
fi
