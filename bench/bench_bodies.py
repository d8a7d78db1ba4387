#!/usr/bin/env python2.7
"""Cost of resolving every scope of a file through CScopeBodyCache.

    bench_bodies.py [--sizes 1000,10000,100000] [--rounds N]

For files of about 1k, 10k and 100k logicals (synthesised as in
bench_edits.py, named by a whole-list pass), a fresh cache is asked
GetBodyOfScope(name) for the full name of every scope, in file order, which
resolves each scope's definition through its parent's cached body. Printed:
the total for all scopes and the cost per scope, medians over rounds (each
with a fresh cache) with their spread, and the 100k/1k ratio per scope.
"""

from __future__ import print_function

import argparse
import sys

import benchkit
from benchkit import Clock, FormatSpread, Spread

from pysource.scopebodycache import CScopeBodyCache, GetFullNameForScopeDef


def ScopeNames(lst):
    return [''] + [GetFullNameForScopeDef(l) for l in lst if l.fKind in (1, 2)]


def Bench(size, rounds):
    lst, _ = benchkit.NamedList(size)
    names = ScopeNames(lst)
    totals = []
    for _ in range(rounds):
        cache = CScopeBodyCache(lst)
        get = cache.GetBodyOfScope
        start = Clock()
        for name in names:
            get(name)
        totals.append(Clock() - start)
    return len(lst), len(names), totals


def main(argv=None):
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument('--sizes', default='1000,10000,100000')
    parser.add_argument('--rounds', type=int, default=9)
    args = parser.parse_args(argv)
    results = [Bench(int(s), args.rounds) for s in args.sizes.split(',')]
    print('GetBodyOfScope for every scope, fresh cache; median [10th-90th percentile] over %d rounds'
          % args.rounds)
    print('%-9s %-7s %-24s %s' % ('logicals', 'scopes', 'all scopes (ms)', 'per scope (us)'))
    for count, scopes, totals in results:
        print('%-9d %-7d %-24s %s' % (count, scopes, FormatSpread([t * 1e3 for t in totals]),
                                       FormatSpread([t * 1e6 / scopes for t in totals])))
    if len(results) > 1:
        per = [Spread(totals)[0] / scopes for _, scopes, totals in results]
        print('per-scope ratio, %d vs %d logicals: %.2fx' % (results[-1][0], results[0][0], per[-1] / per[0]))
    return 0


if __name__ == '__main__':
    sys.exit(main())
