# SPDX-License-Identifier: Apache-2.0
# The usual targets to build, test and demonstrate. Each installs missing packages, does only what
# is not up to date, and prints what it runs. All output is in build/.

JOBS ?= $(shell nproc)
# Most of their time tests wait.
TEST_JOBS ?= $(shell expr 2 '*' $(JOBS))
stage := $(CURDIR)/build/stage

.DEFAULT_GOAL := help
.PHONY: help build build-dev test torture demo bench vendor format check clean stage deps-build deps-test deps-lab deps-check

help: ## this list
	@sed -n 's/^\([a-z-]*\):.*## /\1\t/p' $(MAKEFILE_LIST) | while IFS="$$(printf '\t')" read -r target text; do \
		printf '  make %-8s %s\n' "$$target" "$$text"; done

demo: deps-lab stage ## two appliances on this machine pair, talk and part
	@OVRADR_LAB_PREFIX='$(stage)' lab/demo

test: deps-test deps-lab build-dev ## every test, each on its own node (TESTS=regex selects some)
	@lab/lab way | sed 's/^/tests run by way of /'
	ctest --preset dev -j $(TEST_JOBS) --no-tests=error $(if $(TESTS),-R '$(TESTS)')

torture: deps-test deps-check deps-lab build-dev ## what crashes, crowds, rubbish and long use leave (OVRA_TORTURE=N: how long)
	OVRA_TORTURE=$(or $(OVRA_TORTURE),100) ctest --preset dev -L torture -j $(JOBS)
	tools/check-threads
	tools/fuzz 600

bench: deps-build deps-lab build/bench/build.ninja ## the benchmarks, compared with their baselines
	@cmake --build build/bench -j $(JOBS) --target bench

vendor: deps-test deps-check ## the library on a vendor's own platform, with stand-ins for it
	@tools/check-vendor

build: deps-build build/release/build.ninja ## the libraries and programs, optimised
	@cmake --build build/release -j $(JOBS)

stage: build
	@cmake --install build/release --prefix '$(stage)' >build/stage.log || { cat build/stage.log; exit 1; }

build-dev: deps-test build/dev/build.ninja
	@cmake --build build/dev -j $(JOBS)

# Ninja reconfigures by itself when a CMakeLists.txt changes, but not when the presets do. The
# benchmarks have their own build tree, so that the demo does not wait for them.
build/dev/build.ninja: CMakePresets.json
	cmake --preset dev
	@touch $@
build/release/build.ninja: CMakePresets.json
	cmake --preset release -D OVRADRNODE_BUILD_BENCH=OFF
	@touch $@
build/bench/build.ninja: CMakePresets.json
	cmake --preset release -B build/bench
	@touch $@

format: deps-check ## format every C++ file
	@tools/sources cpp | xargs -0 clang-format -i

check: deps-build deps-check ## the CI checks that need no build
	@tools/check

clean: ## remove all output
	rm -rf build

deps-build deps-test deps-lab deps-check: deps-%:
	@scripts/install-deps $*
