"""One episode: a seeded document, a finder and a cache, and a run of random
actions against them, with the oracles checked after each action."""

import random
import sys

import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache, GetFullNameForScopeDef

from fuzzkit import hostile, texts
from fuzzkit.calls import Finding, Short
from fuzzkit.names import FreshNames, Names, ScopeNames, _Ask, _Same, kRecursion

kProfiles = (('edits', 3), ('badargs', 3), ('hostile', 4), ('pickles', 2), ('mixed', 2))
try:
    from fuzzkit import documents
    if documents.Available():
        kProfiles += (('documents', 3),)
except ImportError:  # the text-edit replay's tools are not beside this one
    documents = None
# Shapes of the faults already known; --known keeps the generator away from them.
kKnownShapes = {
    'foreign-added-O': 'under -O an added logical not in the list renames the last logical',
    'dedent-fail-O': 'under -O a failing _ProcessDedentedComments loops the incremental pass',
    'bad-after-comment-O': 'under -O a bad item after an added comment leaves it unnamed',
    'prepare-raise-after-base': 'a _PrepareForFind override raising after the base step',
    'clear-fails': 'a _Clear override that fails leaves the finder stuck',
    'kwargs-clear': 'an override clearing the caller\'s **kwargs frees added_list',
    'undo': 're-inserting the removed logical objects themselves leaves stale names',
    'propagate-prefix': '_PropagateScopeIndexChangeForward matches f#10 for f#1',
}


class Tags(set):
    """Shapes met in the episode; each is written to the log when first met."""

    def __init__(self, recorder):
        set.__init__(self)
        self.rec = recorder

    def add(self, tag):
        if tag not in self:
            self.rec.Note('tag %s' % tag)
            set.add(self, tag)


class Context(object):
    """Everything one episode works on."""

    def __init__(self, seed, index, recorder, known, optimized, profile=None):
        self.seed, self.index = seed, index
        self.rng = random.Random('%s/%d' % (seed, index))
        self.rec = recorder
        self.known = known
        self.optimized = optimized
        self.profile = profile or self._Pick(kProfiles)
        self.tags = Tags(recorder)
        self.dirty = False            # something foreign may be in the list or its names
        self.plant = None
        self.plan = hostile.Plan()
        self.plan.on_fire = lambda step, act: __import__('fuzzkit.actions').actions.OnFire(
            self, step, act)
        self.globals = hostile.Globals()
        self.threads = hostile.Threads()
        self.kwargs = None            # the **kwargs dict of the FindChanges being made
        self.legit_finding = False    # the fuzzer itself left the finder mid-find
        cap = 10 if known else 14
        self.src = texts.SourceMaker(self.rng, max_repeats=cap)
        self.edits = texts.EditMaker(self.rng, self.src)
        hostile_classes = self.profile in ('hostile', 'mixed')
        self.finder_class, self.cache_class = CChangeFinder, CScopeBodyCache
        guard = self.known and self.optimized and self.profile != 'edits'
        if hostile_classes or guard:
            steps = [s for s in hostile.kFinderSteps if self.rng.random() < 0.6] \
                if hostile_classes else []
            if guard and '_ProcessDedentedComments' not in steps:
                steps.append('_ProcessDedentedComments')
            self.finder_class = hostile.HostileClass(CChangeFinder, steps, self.plan, self)
        if hostile_classes:
            steps = [s for s in hostile.kCacheSteps if self.rng.random() < 0.6]
            self.cache_class = hostile.HostileClass(CScopeBodyCache, steps, self.plan, self)
        self.doc = None
        self.finder = self.cache = None

    def _Pick(self, table):
        total = sum(w for _, w in table)
        r = self.rng.uniform(0, total)
        for name, w in table:
            r -= w
            if r <= 0:
                return name
        return table[-1][0]

    def Pick(self, table):
        return self._Pick(table)

    def ForeignOK(self):
        """Whether a logical that is not in the list may be passed as added."""
        return not (self.known and self.optimized)

    def Call(self, kind, text, func, *args, **kwargs):
        return self.rec.Call(kind, text, func, *args, **kwargs)

    def S(self, obj):
        return Short(obj, self.doc.lst if self.doc else None)

    # -- set-up and repair -------------------------------------------------

    def Start(self):
        for _ in range(20):
            try:
                self.doc = texts.Document(self.src.Make())
                break
            except texts.Rejected:
                continue
        else:
            self.doc = texts.Document('x = 1\n')
        self.rec.Note('profile %s; text:\n%s' % (self.profile, '\n'.join(
            '  # | ' + line for line in self.doc.text.split('\n'))))
        self.Renew()

    def Renew(self):
        """A new finder and cache over the live list, named by a whole pass."""
        lst = self.doc.lst
        ok, finder = self.Call('CChangeFinder()', 'finder = %s(lst)' % self.finder_class.__name__,
                               self.finder_class, lst)
        if not ok:
            raise Finding('renew', 'making a finder raised %r' % (finder,))
        self.finder = finder
        self.WholePass('renew')
        ok, cache = self.Call('CScopeBodyCache()', 'cache = %s(lst)' % self.cache_class.__name__,
                              self.cache_class, lst)
        if not ok:
            raise Finding('renew', 'making a cache raised %r' % (cache,))
        self.cache = cache
        self.Warm()

    def WholePass(self, why):
        ok, result = self.Call('FindChanges[whole]', 'finder.FindChanges(lst, [])  # %s' % why,
                               self.finder.FindChanges, self.doc.lst, [])
        if not ok:
            raise Finding('whole-pass', 'a whole-list pass on a clean list raised %s: %s'
                          % (type(result).__name__, result))
        self.CheckNames('whole pass (%s)' % why)

    def Resync(self):
        """Back to a clean state after hostility: the live list read again if
        anything foreign got into it, module globals restored, a whole pass."""
        self.Disarm()
        lst = self.doc.lst
        try:
            fresh = texts.Read(self.doc.text)
            clean = texts.SameReading(lst, fresh)
        except Exception:
            clean = False
        if self.dirty or not clean:
            self.dirty = False
            self.rec.Note('read the live list again')
            lst[:] = texts.Read(self.doc.text)
            self.doc.undo = None
        if self.finder._fLogicalList is not lst or type(self.finder) is not self.finder_class \
                or type(self.cache) is not self.cache_class or self.cache._fLogicalList is not lst \
                or self.cache._fScopeBodyCache is None or self.cache._fScopeDefCache is None:
            self.Renew()
            return
        self.WholePass('resync')
        self.Call('Clear', 'cache.Clear()', self.cache.Clear)
        self.Warm()

    def Warm(self):
        for name in ScopeNames(self.doc.lst):
            self.Call('GetBodyOfScope', 'cache.GetBodyOfScope(%r)' % name,
                      self.cache.GetBodyOfScope, name)

    def Disarm(self):
        self.plan.armed = False
        self.globals.Restore()
        self.kwargs = None
        stuck = self.threads.JoinAll(10.0)
        if stuck:
            raise Finding('hang', 'a thread started by an override did not end in 10 s')
        for name in list(getattr(self.finder, '__dict__', {})):
            if name in hostile.kFinderSteps:
                del self.finder.__dict__[name]

    # -- oracles -------------------------------------------------------------

    def CheckNames(self, where, script=None):
        fresh = FreshNames(self.doc.text)
        lst = self.doc.lst
        if len(fresh) != len(lst):
            raise AssertionError('fuzzer bug: list and text differ in length')
        diffs = [(k, Names(a), Names(b)) for k, (a, b) in enumerate(zip(lst, fresh))
                 if Names(a) != Names(b)]
        if diffs:
            shown = '; '.join('lst[%d] %s: got %r, whole pass %r' % (
                k, list(lst[k].fTokens)[:3], got, want) for k, got, want in diffs[:6])
            raise Finding('names', '%s: %d logical(s) differ: %s' % (where, len(diffs), shown),
                          script)

    def CheckUnnamed(self, added, where):
        """Weaker check when the list held a bad item: no added logical that
        is still in the list was left without a scope name."""
        ids = set(id(l) for l in self.doc.lst)
        left = [l for l in added if id(l) in ids and type(l) is hostile.LogicalLineType
                and l.fScopeName is None]
        if left:
            raise Finding('unnamed', '%s returned normally with %d added logical(s) unnamed, '
                          'first %s' % (where, len(left), self.S(left[0])))

    def CheckUsable(self, where):
        """After any call a plain FindChanges must not find the finder stuck."""
        self.Disarm()
        if self.legit_finding:
            self.Call('_Clear', 'CChangeFinder._Clear(finder)  # the fuzzer left it mid-find',
                      CChangeFinder._Clear, self.finder)
            self.legit_finding = False
        ok, result = self.Call('FindChanges[usable]', 'finder.FindChanges([], [])',
                               self.finder.FindChanges, [], [])
        if not ok and isinstance(result, ValueError) and str(result) == kRecursion:
            raise Finding('stuck', 'after %s the finder refuses every FindChanges: %s'
                          % (where, result))

    def CheckCache(self, old_names, changes, where):
        """The warm cache, cleared of `changes`, answers like a fresh one."""
        ok, _ = self.Call('Clear', 'cache.Clear(%s)' % Short(sorted(changes)),
                          self.cache.Clear, sorted(changes))
        if not ok:
            raise Finding('cache', 'Clear of the change sets raised')
        fresh = CScopeBodyCache(self.doc.lst)
        new_names = ScopeNames(self.doc.lst)
        problems = []
        for name in new_names + [n for n in old_names if n not in set(new_names)]:
            for method in ('GetScopeDef', 'GetBodyOfScope'):
                w = _Ask(getattr(self.cache, method), name)
                f = _Ask(getattr(fresh, method), name)
                if not _Same(w, f):
                    problems.append('%s(%r): warm %s, fresh %s' % (
                        method, name, self.S(w[1]) if w[0] == 'ok' else w[0],
                        self.S(f[1]) if f[0] == 'ok' else f[0]))
        if problems:
            raise Finding('cache', '%s: %d stale answer(s), e.g. %s; changes were %s' % (
                where, len(problems), '; '.join(problems[:3]), Short(sorted(changes))))

    def FilterResult(self, step, args, result, raised):
        """Under -O with --known, a _ProcessDedentedComments that failed (or
        an override of it that gave no index past its argument) would send
        the incremental pass round for ever (a known fault): end the pass
        with an index past the list instead."""
        if step != '_ProcessDedentedComments' or not (self.known and self.optimized):
            return result
        try:
            first = int(args[0])
            bad = raised or not isinstance(result, (int, long)) or result <= first
        except Exception:
            bad = True
        if bad:
            self.tags.add('dedent-fail-O')
            return 1 << 40
        return result


def RunEpisode(seed, index, recorder, known, optimized, steps=None, profile=None, plant=None):
    """Runs one episode; returns its Context. Raises Finding (with the
    episode's tags and profile attached)."""
    from fuzzkit import actions
    ctx = Context(seed, index, recorder, known, optimized, profile)
    ctx.plant = plant
    recorder.Begin('episode %d of seed %s (profile %s)' % (index, seed, ctx.profile))
    saved_interval = hostile.GetSwitchInterval()
    try:
        if ctx.profile == 'documents':
            return documents.Run(ctx, steps or ctx.rng.randint(8, 40))
        ctx.Start()
        for n in range(steps or ctx.rng.randint(8, 40)):
            action = 'Plant' if plant and n == 1 else ctx.Pick(actions.kTables[ctx.profile])
            recorder.Note('action %d: %s' % (n, action))
            ctx.tags.clear()   # a shape counts for the action it was met in
            getattr(actions, action)(ctx)
    except Finding as f:
        f.tags = sorted(ctx.tags)
        f.profile = ctx.profile
        raise
    finally:
        hostile.SetSwitchInterval(saved_interval)
        ctx.plan.armed = False
        ctx.globals.Restore()
        ctx.threads.JoinAll(10.0)
    return ctx


def Canary():
    """The module globals are back where they were."""
    import pysource._fastaccess
    import pysource.symbolinfo
    return (sbc.__dict__.get('_fastaccess') is pysource._fastaccess and
            sbc.__dict__.get('symbolinfo') is pysource.symbolinfo and
            sbc.__dict__.get('GetFullNameForScopeDef') is GetFullNameForScopeDef)
