# The two set-up commands of the README are `make demo` and `make test`.
# Both install what is missing, build, and then run the tool or the tests.

BUILD      ?= build
ASAN_BUILD ?= build-asan
FUZZ_BUILD ?= build-fuzz
JOBS       ?= $(shell nproc 2>/dev/null || echo 2)
CMAKE_GEN  := -G Ninja

.PHONY: all deps build demo test install check-install bench coverage sanitize fuzz fuzz-smoke clean

all: build

deps:
	@scripts/install-deps.sh

$(BUILD)/build.ninja: | deps
	cmake -S . -B $(BUILD) $(CMAKE_GEN) -DCMAKE_BUILD_TYPE=RelWithDebInfo

build: deps $(BUILD)/build.ninja
	cmake --build $(BUILD) -j $(JOBS)

demo: build
	@scripts/demo.sh $(BUILD)/bin/zantiff

test: build
	ctest --test-dir $(BUILD) --output-on-failure -j $(JOBS)

# Installs headers, libraries, the tool, the CMake package and zantiff.pc
# under PREFIX.
PREFIX ?= /usr/local
install: build
	cmake --install $(BUILD) --prefix $(PREFIX)

# Installs into a temporary prefix and builds and runs the example host
# against it, with CMake and with pkg-config.
check-install: build
	@scripts/check-install.sh $(BUILD) samples/demo-multipage.tif

bench: build
	@scripts/run-bench.sh $(BUILD)

# Line and function coverage of src/ by the test suite (gcov, lcov).
coverage: deps
	@scripts/coverage.sh build-cov

# The whole suite again under AddressSanitizer and UndefinedBehaviorSanitizer,
# leak detection on.
sanitize: deps
	cmake -S . -B $(ASAN_BUILD) $(CMAKE_GEN) -DCMAKE_BUILD_TYPE=Debug -DZANTIFF_SANITIZE=ON
	cmake --build $(ASAN_BUILD) -j $(JOBS)
	ASAN_OPTIONS=detect_leaks=1:abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
	  ctest --test-dir $(ASAN_BUILD) --output-on-failure -j $(JOBS)

# libFuzzer targets (clang).
fuzz: deps
	CC=clang CXX=clang++ cmake -S . -B $(FUZZ_BUILD) $(CMAKE_GEN) -DCMAKE_BUILD_TYPE=RelWithDebInfo \
	  -DZANTIFF_FUZZ=ON -DZANTIFF_TESTS=OFF
	cmake --build $(FUZZ_BUILD) -j $(JOBS)

# A short run of every fuzz target over the seeds.
fuzz-smoke: fuzz
	@scripts/fuzz-smoke.sh $(FUZZ_BUILD) 30

clean:
	rm -rf $(BUILD) $(ASAN_BUILD) $(FUZZ_BUILD)
