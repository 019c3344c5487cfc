#!/usr/bin/env bash
# Regenerates the sample AVHRR pass of the orbit model in examples/ with the
# lumo tool: a simulated 600-line morning pass over Europe whose true roll is
# 0.1 degree off and which runs 2 km ahead of its nominal orbit, 20 control
# points and 100 check points of that true pass, and the model refined with
# the control points. Run from the repository root after a build:
#
#   bash scripts/make_lrs_example.sh build/tools/lumo
set -euo pipefail
LUMO="${1:-build/tools/lumo}"
"$LUMO" simulate-avhrr --lines 600 --roll-bias 0.1 --along-track-bias 2 --seed 1 \
  --segment examples/avhrr_pass.segment.json --gcps examples/avhrr_pass_gcps.csv \
  --checks examples/avhrr_pass_checks.csv
"$LUMO" fit --model lrs --segment examples/avhrr_pass.segment.json \
  --gcps examples/avhrr_pass_gcps.csv -o examples/lrs_avhrr_pass.json
