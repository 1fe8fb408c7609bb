# SPDX-License-Identifier: Apache-2.0
# Short names for the usual jobs; what is built, and how, is in CMakePresets.json and the CMake files.
SHELL := /bin/bash
JOBS ?= $(shell nproc)
PREFIX ?= /usr/local
DESTDIR ?=
FUZZ_SECONDS ?= 60
BENCH_ARGS ?=
BENCH_APPLY_ARGS ?=
SOAK_SECONDS ?= 240

# $(call build,<preset>[,<configure options>[,<build options>]]) configures and builds the preset in build-<preset>.
build = cmake --preset $(1) --log-level=NOTICE $(2) && cmake --build --preset $(1) --parallel $(JOBS) $(3)

.PHONY: help demo test bench lint format sanitize tsan fuzz faults install package packagetest clean soak bench-apply
.DEFAULT_GOAL := help

help: ## list the targets
	@sed -nE 's/^([a-z-]+):.*## (.*)/  make \1\t\2/p' $(MAKEFILE_LIST) | expand -t 20

demo: ## install what is needed, build, and show the firewall at work in a sandbox
	scripts/install-dependencies.sh demo
	$(call build,release)
	scripts/demo.sh build-release

test: ## install what is needed, build, and run all tests
	scripts/install-dependencies.sh test
	$(call build,dev)
	ctest --preset dev --parallel $(JOBS)

soak: ## reloads, edits, queries, a neighbour and a held lock at once, for SOAK_SECONDS (240)
	scripts/install-dependencies.sh test
	$(call build,dev,,--target soak_test)
	VELD_SOAK_SECONDS=$(SOAK_SECONDS) ctest --preset dev --parallel 2 --tests-regex '^soak_test' --verbose

bench: ## measure; prints a table, writes out/bench.json (BENCH_ARGS=--smoke: only a quick run)
	scripts/install-dependencies.sh bench
	$(call build,bench)
	mkdir -p out
	build-bench/bench/veld_bench --benchmark_out=out/bench.json --benchmark_out_format=json $(BENCH_ARGS)

bench-apply: ## measure each way of applying a profile (half an hour); writes out/apply.json and out/reload.svg
	scripts/install-dependencies.sh bench
	$(call build,bench,,--target veld_bench_apply)
	mkdir -p out
	build-bench/bench/apply/veld_bench_apply --out=out/apply.json $(BENCH_APPLY_ARGS)
	scripts/plot-apply.py out/apply.json out/reload.svg

lint: ## check format and scripts of everything; clang-tidy of library, stand-ins and tool
	scripts/install-dependencies.sh lint
	scripts/lint.sh
	cmake --preset tidy --log-level=NOTICE
	run-clang-tidy -quiet -p build-tidy -j $(JOBS) '^(?!.*/tests/).*/(src|platform|tools)/' 2>&1 | { grep -vE '^([0-9]+ warnings generated\.|)$$' || true; }; exit $${PIPESTATUS[0]}

format: ## rewrite the sources in the project's format
	scripts/install-dependencies.sh lint
	git ls-files -z '*.c' '*.cpp' '*.h' | xargs -0 clang-format -i

sanitize: ## run the tests with AddressSanitizer and UndefinedBehaviorSanitizer
	scripts/install-dependencies.sh test
	$(call build,asan)
	ctest --preset asan --parallel $(JOBS)

tsan: ## run the tests with ThreadSanitizer
	scripts/install-dependencies.sh test
	$(call build,tsan)
	ctest --preset tsan --parallel $(JOBS)

fuzz: ## fuzz each target for FUZZ_SECONDS (60)
	scripts/install-dependencies.sh fuzz
	$(call build,fuzz)
	scripts/fuzz.sh build-fuzz $(FUZZ_SECONDS)

faults: ## fail each system call of a write and a reload in turn, and kill at each (make test: a part)
	scripts/install-dependencies.sh test
	$(call build,dev)
	VELD_FAULTS=full ctest --preset dev --parallel $(JOBS) --tests-regex '^faults_test' --verbose

install: ## install below DESTDIR in PREFIX (/usr/local)
	scripts/install-dependencies.sh build
	$(call build,release,-DCMAKE_INSTALL_PREFIX=$(PREFIX))
	DESTDIR=$(DESTDIR) cmake --install build-release

package: ## build the Debian packages in out/packages
	scripts/install-dependencies.sh package
	$(call build,package)
	cpack --preset package

packagetest: package ## install, use and purge the packages in a clean Debian tree (as root)
	scripts/test-packages.sh out/packages

clean: ## remove everything that was built
	rm -rf build-dev build-release build-asan build-tsan build-tidy build-bench build-fuzz build-package out
