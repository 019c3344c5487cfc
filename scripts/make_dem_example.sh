#!/usr/bin/env bash
# Generates examples/demo_dem.tif, the small elevation file under the
# orthoimage row of `lumo demo`: smooth hills (300 to 1100 m above mean sea
# level) on 25 m cells, 5 km square around 45 N 3 E, in UTM zone 31N. Not part
# of the build; needs python3 and gdal-bin. Run by hand from the repository
# root: bash scripts/make_dem_example.sh
set -euo pipefail
WORK="$(mktemp -d)"
trap 'rm -rf "$WORK"' EXIT
python3 - > "$WORK/dem.asc" <<'PY'
import math
n, cell, x0, y0 = 200, 25.0, 497500.0, 4980450.0
print(f"ncols {n}\nnrows {n}\nxllcorner {x0}\nyllcorner {y0}\ncellsize {cell}")
for r in range(n):
    y = y0 + (n - r - 0.5) * cell - 4982950.0
    row = []
    for c in range(n):
        x = x0 + (c + 0.5) * cell - 500000.0
        h = 700 + 350 * math.sin(x / 700) * math.cos(y / 900) + 40 * math.sin(x / 170 + y / 230)
        row.append(str(round(h)))
    print(" ".join(row))
PY
gdal_translate -q -ot Int16 -a_srs EPSG:32631 -co COMPRESS=DEFLATE -co PREDICTOR=2 \
  "$WORK/dem.asc" examples/demo_dem.tif
rm -f examples/demo_dem.tif.aux.xml
