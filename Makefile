# Thin wrapper over CMake. `make demo` runs the daemon on a demo device; `make test` builds and
# runs every test, then the whole suite again under AddressSanitizer + UndefinedBehaviorSanitizer,
# then the in-process suites under ThreadSanitizer.

JOBS ?= $(shell nproc)
BUILD ?= build
ASAN_BUILD ?= build-asan
TSAN_BUILD ?= build-tsan
TSAN_SUITES = platform_tests annexa_tests plugin_tests axd_tests
BENCH_BUILD ?= build-bench
FUZZ_BUILD ?= build-fuzz
FUZZ_SECONDS ?= 60

.PHONY: all bootstrap build test test-asan test-tsan demo bench fuzz format clean

all: build

bootstrap:
	@scripts/bootstrap

build: bootstrap
	cmake -S . -B $(BUILD) -DCMAKE_BUILD_TYPE=RelWithDebInfo >/dev/null
	cmake --build $(BUILD) -j $(JOBS)

test: build
	cd $(BUILD) && ctest --output-on-failure -j $(JOBS)
	$(MAKE) test-asan
	$(MAKE) test-tsan

test-asan: bootstrap
	cmake -S . -B $(ASAN_BUILD) -DCMAKE_BUILD_TYPE=Debug -DAXD_SANITIZE=ON >/dev/null
	cmake --build $(ASAN_BUILD) -j $(JOBS)
	cd $(ASAN_BUILD) && ASAN_OPTIONS=detect_leaks=1 ctest --output-on-failure -j $(JOBS)

# The in-process suites hold every concurrency test; the end-to-end suite adds only processes.
test-tsan: bootstrap
	cmake -S . -B $(TSAN_BUILD) -DCMAKE_BUILD_TYPE=Debug -DAXD_TSAN=ON >/dev/null
	cmake --build $(TSAN_BUILD) -j $(JOBS) --target $(TSAN_SUITES)
	for suite in $(TSAN_SUITES); do $(TSAN_BUILD)/tests/$$suite --gtest_brief=1 || exit 1; done

demo: build
	scripts/demo $(BUILD)

bench: bootstrap
	cmake -S . -B $(BENCH_BUILD) -DCMAKE_BUILD_TYPE=Release >/dev/null
	cmake --build $(BENCH_BUILD) -j $(JOBS)
	scripts/bench $(BENCH_BUILD)

# Each target runs for FUZZ_SECONDS from its committed seeds; new inputs it finds stay in
# $(FUZZ_BUILD)/corpus/<directory>. `make test` replays the committed seeds (docs/fuzzing.md).
FUZZ_TARGETS = FrameDecoderFuzz:frame PropertyListFuzz:plist CborCodecFuzz:cbor \
  EntitlementEntryFuzz:entitlements SigningFileFuzz:signing SdkMergeFuzz:sdk ActivationRuleFuzz:activation \
  ExtensionTokenFuzz:token ServiceFileFuzz:service RecordCodecFuzz:record \
  AnnotationFileFuzz:annotations MatchRuleFuzz:match RequestDispatchFuzz:dispatch

fuzz:
	@scripts/bootstrap --fuzz
	CC=clang CXX=clang++ cmake -S . -B $(FUZZ_BUILD) -DCMAKE_BUILD_TYPE=RelWithDebInfo -DAXD_FUZZ=ON >/dev/null
	cmake --build $(FUZZ_BUILD) -j $(JOBS) --target $(foreach t,$(FUZZ_TARGETS),$(word 1,$(subst :, ,$(t))))
	for entry in $(FUZZ_TARGETS); do \
	  target=$${entry%%:*}; corpus=$(FUZZ_BUILD)/corpus/$${entry##*:}; mkdir -p $$corpus && \
	  $(FUZZ_BUILD)/fuzz/$$target -max_total_time=$(FUZZ_SECONDS) $$corpus fuzz/corpus/$${entry##*:} \
	    || exit 1; \
	done

format:
	git ls-files '*.h' '*.cpp' | xargs clang-format -i

clean:
	rm -rf $(BUILD) $(ASAN_BUILD) $(TSAN_BUILD) $(BENCH_BUILD) $(FUZZ_BUILD)
