# Front door: every target sets itself up, so each works on a fresh machine.
JOBS ?= 2
CMAKE_FLAGS ?=

.PHONY: all deps build test asan tsan demo bench soak fuzz lint clean

all: build

deps:
	@tools/install-deps.sh

# Phony on purpose: always reconfigure and rebuild into build/: the library,
# its tools and what the tests need. The demo and the benchmarks are built by
# their own targets.
build: deps
	cmake -S . -B build $(CMAKE_FLAGS)
	cmake --build build -j $(JOBS)

test: build
	ctest --test-dir build --output-on-failure -j $(JOBS)

asan: deps
	cmake -S . -B build-asan -DHOSTCALL_SANITIZE=address,undefined $(CMAKE_FLAGS)
	cmake --build build-asan -j $(JOBS)
	ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1:halt_on_error=1 \
	  ctest --test-dir build-asan --output-on-failure -j $(JOBS)

# The C++ suite under ThreadSanitizer (the JVM cannot host it).
tsan: deps
	cmake -S . -B build-tsan -DHOSTCALL_SANITIZE=thread $(CMAKE_FLAGS)
	cmake --build build-tsan -j $(JOBS)
	TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1 \
	  ctest --test-dir build-tsan --output-on-failure -j $(JOBS) -L cxx

demo: build
	cmake --build build -j $(JOBS) --target hostcall_demo
	demo/run-demo.sh build

# Figures only: nothing here passes or fails on time.
bench: build
	cmake --build build -j $(JOBS) --target hostcall_bench
	bench/run-bench.sh build

# The service bridge's soak at full size (make test runs it short).
soak: build
	HOSTCALL_SOAK_EVENTS=400000 ctest --test-dir build --output-on-failure -L soak

# Each fuzz target for FUZZ_SECONDS on its corpus (clang's libFuzzer); CI runs
# `make fuzz FUZZ_SECONDS=20`.
FUZZ_SECONDS ?= 60
fuzz: deps
	cmake -S . -B build-fuzz -DHOSTCALL_FUZZ=ON -DHOSTCALL_SANITIZE=address,undefined \
	  -DCMAKE_C_COMPILER=clang -DCMAKE_CXX_COMPILER=clang++ $(CMAKE_FLAGS)
	cmake --build build-fuzz -j $(JOBS) --target hostcall_fuzz
	fuzz/run-fuzz.sh build-fuzz $(FUZZ_SECONDS)

# The platform build file parses, is formatted and lists, module for target,
# the sources CMake builds; clang's thread-safety analysis and clang-tidy run
# clean over the library.
lint: deps
	cmake -S . -B build -DCMAKE_EXPORT_COMPILE_COMMANDS=ON $(CMAKE_FLAGS)
	tools/lint/check-android-bp.sh . build
	tools/lint/check-thread-safety.sh
	tools/lint/run-clang-tidy.sh build $(JOBS)

clean:
	rm -rf build build-asan build-tsan build-fuzz
