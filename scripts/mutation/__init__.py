"""The parts of scripts/mutate.py: sites (where a one-line fault can go), locate (finding
saved sites again), processes (running builds and suites), mutants (making and judging
one fault) and cli (the command line)."""
