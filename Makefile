# thevorn: the two commands that matter are `make run` and `make test`.
BUILD_DIR ?= build
SAN_DIR   ?= build-asan
TSAN_DIR  ?= build-tsan
FUZZ_DIR  ?= build-fuzz
FUZZ_SECONDS ?= 60
FUZZ_TARGETS ?=
JOBS      ?= $(shell nproc)
CMAKE_ARGS ?=

.PHONY: deps configure build test run bench sanitize tsan fuzz-build fuzz fuzz-ci clean

deps:
	@scripts/install-deps

$(BUILD_DIR)/build.ninja:
	cmake -S . -B $(BUILD_DIR) -G Ninja -DCMAKE_BUILD_TYPE=Release $(CMAKE_ARGS)

configure: deps $(BUILD_DIR)/build.ninja

build: configure
	cmake --build $(BUILD_DIR) -j $(JOBS)

test: build
	cd $(BUILD_DIR) && ctest --output-on-failure -j $(JOBS) --timeout 600

run: build
	@scripts/run-example $(BUILD_DIR)

bench: build
	@echo "benchmarks are in $(BUILD_DIR)/bench/"

# Address and undefined-behaviour sanitizers over the tests.
sanitize: deps
	cmake -S . -B $(SAN_DIR) -G Ninja -DCMAKE_BUILD_TYPE=Debug -DOX_SANITIZE=address -DOX_BUILD_BENCH=OFF
	cmake --build $(SAN_DIR) -j $(JOBS)
	cd $(SAN_DIR) && ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1 \
		ctest --output-on-failure -j $(JOBS) --timeout 900

# ThreadSanitizer over the test programs of the threads, locks, work server, tile renderer,
# tiled frame layers and the texture manager.
TSAN_TESTS ?= platform render texture
tsan: deps
	cmake -S . -B $(TSAN_DIR) -G Ninja -DCMAKE_BUILD_TYPE=Debug -DOX_SANITIZE=thread -DOX_BUILD_BENCH=OFF
	cmake --build $(TSAN_DIR) -j $(JOBS) --target $(addsuffix _tests,$(TSAN_TESTS))
	set -e; for t in $(TSAN_TESTS); do \
		TSAN_OPTIONS="halt_on_error=1 second_deadlock_stack=1" $(TSAN_DIR)/tests/$$t/$${t}_tests; \
	done

# The libFuzzer targets (fuzz/), built with clang under the address and undefined-behaviour
# sanitizers in a build directory of their own.
fuzz-build:
	@OX_WITH_FUZZ_DEPS=1 scripts/install-deps
	CC=clang CXX=clang++ cmake -S . -B $(FUZZ_DIR) -G Ninja -DCMAKE_BUILD_TYPE=Release -DOX_FUZZ=ON
	cmake --build $(FUZZ_DIR) -j $(JOBS) --target ox_fuzz_all

# Each target for FUZZ_SECONDS (default 60); new crashes are kept in fuzz/crashes/<target>/.
fuzz: fuzz-build
	scripts/fuzz run $(FUZZ_DIR) $(FUZZ_SECONDS) $(FUZZ_TARGETS)

# CI: every target over its seed corpus, then 30 s of fresh fuzzing; any failure fails.
fuzz-ci: fuzz-build
	scripts/fuzz ci $(FUZZ_DIR) 30 $(FUZZ_TARGETS)

clean:
	rm -rf $(BUILD_DIR) $(SAN_DIR) $(TSAN_DIR) $(FUZZ_DIR)
