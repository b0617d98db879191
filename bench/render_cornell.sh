#!/usr/bin/env bash
# Camera render of the Cornell box at 512 x 512: one sample per pixel (rate 0) and sixteen
# (rate 2), on one and two threads. Prints the render time (wall clock, as the run reports it,
# and of that the tile loop alone), the CPU seconds of the whole process, the rays traced, rays
# per wall second and per CPU second, and the two-thread speed-up; then the grid's raw rate for
# camera rays (raytrace_bench, per CPU second) to compare with. Each configuration runs RUNS
# times (default 1) and the fastest run counts. On a busy machine only the CPU figures mean
# much: the load average is printed first.
#   [RUNS=n] bench/render_cornell.sh [build dir]
set -eu
build="$(cd "${1:-build}" && pwd)"
bin="$build/app/thevorn"
import="$build/tools/thevorn-import"
example=examples/cornell
out=out/cornell
work="$(mktemp -d)"
trap 'rm -rf "$work"' EXIT

mkdir -p "$out"
if [ ! -f "$out/cornell.xml" ]; then
    "$import" "$example/cornell.obj" -o "$out" --scale 0.001 --lightmap-uv 256 --force >/dev/null
fi

# Seconds of a "hh:mm:ss.cc" time.
seconds() { awk -F'[:.]' '{ printf "%.2f", $1 * 3600 + $2 * 60 + $3 + $4 / 100 }'; }

runs=${RUNS:-1}
echo "load average: $(cut -d' ' -f1-3 /proc/loadavg)"
declare -A rate_of
for rate in 0 2; do
    cat >"$work/rate$rate.xml" <<EOF
<?xml version="1.0"?>
<OXConfig>
	<FrameSettings>
		<cameraName>cornell_camera</cameraName>
		<resolution><x>512</x><y>512</y></resolution>
		<outputVerbosity><benchmarkPrint>true</benchmarkPrint></outputVerbosity>
	</FrameSettings>
	<AASettings>
		<samplingMode>SuperSampling</samplingMode>
		<minSampleRate>$rate</minSampleRate>
		<maxSampleRate>$rate</maxSampleRate>
		<edgeTracing>false</edgeTracing>
	</AASettings>
</OXConfig>
EOF
    for threads in 1 2; do
        # The best of $runs runs (by render time) stands for the configuration.
        best=""
        for ((run = 0; run < runs; ++run)); do
            log="$work/log_${rate}_${threads}_$run"
            TIMEFORMAT='%U %S'
            cpu=$( { time "$bin" "$out/cornell.xml" "$example/cornell_view.xml" "$out"/*.vtm \
                -x "$work/rate$rate.xml" -r -e -q -rt "$threads" -od "$work/" -o bench >"$log"; } 2>&1 |
                awk '{ printf "%.2f", $1 + $2 }')
            time=$(sed -n 's/.*Done rendering! Total render time: //p' "$log" | seconds)
            # The render command alone (the tile loop); the rest of the render time is the
            # frame's set-up and the image output.
            tiles=$(sed -n 's/.*Command 1: render (\(.*\))/\1/p' "$log" | head -n 1 | seconds)
            if [ -z "$best" ] || awk -v a="$time" -v b="${best%% *}" 'BEGIN { exit !(a < b) }'; then
                best="$time $tiles $cpu $log"
            fi
        done
        read -r time tiles cpu log <<<"$best"
        rays=$(awk '/ rays: / { s += $NF } END { print s + 0 }' "$log")
        rps=$(awk -v r="$rays" -v t="$time" 'BEGIN { printf "%.0f", (t > 0) ? r / t : 0 }')
        rpc=$(awk -v r="$rays" -v t="$cpu" 'BEGIN { printf "%.0f", (t > 0) ? r / t : 0 }')
        rate_of[$rate.$threads]=$time
        printf 'rate %d, %d thread(s): %6.2f s render (%.2f s tiles), %6.2f s CPU, %9d rays, %9d rays/s, %9d rays/CPU s\n' \
            "$rate" "$threads" "$time" "$tiles" "$cpu" "$rays" "$rps" "$rpc"
    done
    awk -v a="${rate_of[$rate.1]}" -v b="${rate_of[$rate.2]}" \
        'BEGIN { if (b > 0) printf "rate %d: two threads %.2fx one (wall clock)\n", '"$rate"', a / b }'
done

if [ -x "$build/bench/raytrace_bench" ]; then
    echo "raw grid rate, camera rays, closest hit (occlusion:0) and any hit (occlusion:1), 70k triangles, one thread (raytrace_bench; Time and CPU are per 256 rays):"
    "$build/bench/raytrace_bench" --benchmark_filter='BM_Grid/mesh:0/camera:1/.*/threads:1$' 2>/dev/null |
        awk '/BM_Grid/ { print "  " $0 }'
fi
