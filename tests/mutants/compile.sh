#!/bin/sh
# Compiles as every build does. What a fault that is put in leaves unused is not told, and its code need not be quick.
# shellcheck disable=SC2046,SC2086
exec $(command -v ccache) "$@" ${KDD_MUTANT:-}
