# The two set-up commands of the README: `make run` and `make test`.
# Both install what is missing, configure and build first.

BUILD_DIR  ?= build
BUILD_TYPE ?= Release
# SANITIZE=address or SANITIZE=thread builds into its own directory.
SANITIZE   ?=
ifneq ($(SANITIZE),)
BUILD_DIR := build-$(SANITIZE)
BUILD_TYPE := RelWithDebInfo
endif

.PHONY: all deps configure build run test sanitizer-job fuzz bench package clean

all: build

deps:
	@scripts/install-deps

configure: deps
	@cmake -S . -B $(BUILD_DIR) -G Ninja -DCMAKE_BUILD_TYPE=$(BUILD_TYPE) -DZAF_SANITIZE=$(SANITIZE) >/dev/null

build: configure
	@cmake --build $(BUILD_DIR)

# Sanitizer findings fail the test that made them: UBSan stops at its first report, ThreadSanitizer
# exits non-zero, and LeakSanitizer (part of ASan) reports at exit.
TEST_ENV = QT_QPA_PLATFORM=offscreen \
  TSAN_OPTIONS="suppressions=$(CURDIR)/scripts/tsan.supp $(TSAN_OPTIONS)" \
  LSAN_OPTIONS="suppressions=$(CURDIR)/scripts/lsan.supp $(LSAN_OPTIONS)" \
  UBSAN_OPTIONS="halt_on_error=1:print_stacktrace=1 $(UBSAN_OPTIONS)"

# A Debian package (build/zafrel_VERSION_ARCH.deb) of the installed layout.
package: build
	@cd $(BUILD_DIR) && cpack

test: build
	@cd $(BUILD_DIR) && $(TEST_ENV) ctest --output-on-failure -j2 --timeout 600

# CI's sanitizer job: AddressSanitizer + UBSan over the test programs of everything that reads
# outside input (movies, IPC messages, catalogues, desktop entries, uploads, the file system), built
# alone so the job fits CI's time. `make test SANITIZE=address` runs the whole suite.
SANITIZER_JOB_TESTS := media_asset_tests media_export_tests media_player_tests media_image_tests \
  media_writer_tests media_odd_size_tests audio_mix_utility_tests tools_tests \
  extensionkit_codec_tests extensionkit_channel_tests extensionkit_runtime_tests extension_tests host_tests \
  bundle_tests store_lookup_tests photos_tests tempstore_tests platform_tests thread_rules_tests publishing_upload_tests \
  corpus_engine_tests corpus_editor_tests host_watch_tests host_library_tests
empty :=
space := $(empty) $(empty)
sanitizer-job:
	@$(MAKE) --no-print-directory configure SANITIZE=address
	@cmake --build build-address --target $(SANITIZER_JOB_TESTS)
	@cd build-address && $(TEST_ENV) ctest --output-on-failure -j2 --timeout 600 \
	  -L '^($(subst $(space),|,$(strip $(SANITIZER_JOB_TESTS))))$$'

# The libFuzzer targets (tests/fuzz), built with clang, ASan and UBSan in build-fuzz, each run for
# FUZZ_SECONDS on its seeds; any finding fails.
FUZZ_SECONDS ?= 60
fuzz: deps
	@FUZZ_SECONDS=$(FUZZ_SECONDS) scripts/run-fuzzers

run: build
	@scripts/run-main

bench: build
	@cmake --build $(BUILD_DIR) --target benchmarks && scripts/run-benchmarks $(BUILD_DIR)

clean:
	rm -rf build build-address build-thread build-fuzz
