# The developers' front door: each word is one line over a preset or a script.
.DEFAULT_GOAL := help
.PHONY: help demo test format format-check lint sanitize bench fuzz package

help: ## show this list
	@sed -n 's/^\([a-z-]*\):.*## /\1|/p' Makefile | awk -F'|' '{ printf "  make %-13s %s\n", $$1, $$2 }'
demo: ## watch events travel from two clients to a collector
	@sh scripts/demo
test: ## build and run every test
	@sh scripts/test
format: ## format every source file
	@sh scripts/format
format-check: ## say which files are not formatted
	@sh scripts/format --check
lint: ## check the house's arrows and run clang-tidy
	@sh scripts/lint
sanitize: ## the tests under the address, undefined and thread sanitizers
	@sh scripts/sanitize
bench: ## measure: single stations, then the whole road beside the ceiling
	@sh scripts/bench
fuzz: ## a minute of fuzzing for each decoder of outside input
	@sh scripts/fuzz
package: ## build the Debian package
	@sh scripts/package
