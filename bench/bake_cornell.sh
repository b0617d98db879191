#!/usr/bin/env bash
# The Cornell box light-map bake (direct light with area-light shadows, one pass
# "tpIllumination" per surface) at 256 x 256 and 1024 x 1024 texels, on 1 and 2 threads:
# texels per second, rays per second, and the share of the post-filter chain in the bake.
# The ray-tracing benchmark's rate (bench/raytrace_bench, BM_Grid) is printed beside.
# Usage: bench/bake_cornell.sh [build directory]
set -eu
build="$(cd "${1:-build}" && pwd)"
bin="$build/app/thevorn"
import="$build/tools/thevorn-import"
work="$(mktemp -d)"
trap 'rm -rf "$work"' EXIT

"$import" examples/cornell/cornell.obj -o "$work" --scale 0.001 --lightmap-uv 256 --force \
    > /dev/null
for size in ${SIZES:-256 1024}; do
    # The example's configuration at this size, statistics on, GI off (direct light only).
    sed -e "s|<x>256</x><y>256</y>|<x>$size</x><y>$size</y>|g" \
        -e "s|<enableGI>true</enableGI>|<enableGI>false</enableGI>|" \
        -e "/<albedo>/d" -e "/<fullShading>/d" \
        -e "s|<FrameSettings>|<FrameSettings><outputVerbosity><benchmarkPrint>true</benchmarkPrint></outputVerbosity>|" \
        examples/cornell/bake.xml > "$work/bake_$size.xml"
    for threads in 1 2; do
        start=$(date +%s.%N)
        "$bin" "$work/cornell.xml" examples/cornell/cornell_view.xml "$work"/*.vtm \
            -x "$work/bake_$size.xml" -b -q -e -rt "$threads" -od "$work/out" -o b \
            > "$work/log.txt" 2>&1
        end=$(date +%s.%N)
        awk -v size="$size" -v threads="$threads" -v wall="$(echo "$end - $start" | bc)" '
            $2 == "texels:" { texels += $3 }
            $2 == "rays:" { rays += $3 }
            $2 == "bake" && $3 == "microseconds:" { bake += $4 }
            $2 == "filter" && $3 == "microseconds:" { filter += $4 }
            END {
                s = (bake + filter) / 1e6
                printf "%4d x %-4d %d thread(s): %9.0f texels/s  %10.0f rays/s  post filters %4.1f%% of %.2f s (wall %.2f s)\n",
                    size, size, threads, texels / (bake / 1e6), rays / (bake / 1e6),
                    100 * filter / (bake + filter), s, wall
            }' "$work/log.txt"
    done
done
if [ -x "$build/bench/raytrace_bench" ]; then
    echo "Ray-tracing benchmark (BM_Grid):"
    "$build/bench/raytrace_bench" --benchmark_filter=BM_Grid 2>/dev/null | grep BM_Grid || true
fi
