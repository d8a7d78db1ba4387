"""The actions an episode is made of, by profile. Each takes the episode
Context, makes its calls through ctx.Call and checks what its oracles can
check; they live by concern in edits, pickles, badargs, overrides and
shared, the planted faults here."""

import time

from fuzzkit.badargs import BadCall, BadEdit, BadListItem, DirectStep, Propagate  # noqa: F401
from fuzzkit.edits import CacheClear, Destroy, Edit, Lookups, Undo, WholePassAgain  # noqa: F401
from fuzzkit.names import NameScript, Rows
from fuzzkit.overrides import (GlobalRebind, HostileCache, HostileEdit, OnFire,  # noqa: F401
                               ThreadEdit)
from fuzzkit.pickles import BadSetstate, BadUnpickle, RoundTrip  # noqa: F401
from fuzzkit.shared import BadAfterGood, Reload, SharedFinders  # noqa: F401

kClean = [('Edit', 12), ('Lookups', 3), ('CacheClear', 2), ('RoundTrip', 2), ('Destroy', 1),
          ('WholePassAgain', 1), ('Undo', 1), ('SharedFinders', 2), ('Reload', 1)]
kBad = [('Edit', 3), ('BadCall', 12), ('BadEdit', 5), ('BadListItem', 3), ('DirectStep', 3),
        ('Propagate', 2), ('BadAfterGood', 3)]
kHostile = [('Edit', 2), ('HostileEdit', 12), ('HostileCache', 4), ('GlobalRebind', 4),
            ('ThreadEdit', 2)]
kPickles = [('Edit', 2), ('RoundTrip', 3), ('BadUnpickle', 10), ('BadSetstate', 4)]
kTables = {'edits': kClean, 'badargs': kBad, 'hostile': kHostile, 'pickles': kPickles,
           'mixed': kClean + kBad + kHostile + kPickles}


# ---------------------------------------------------------------------------
def Plant(ctx):
    if ctx.plant == 'crash':
        import os
        os.abort()
    elif ctx.plant == 'hang':
        while True:
            time.sleep(1)
    elif ctx.plant == 'stuck':
        ctx.finder._PrepareForFind()
        ctx.CheckUsable('a planted _PrepareForFind')
    elif ctx.plant == 'names':
        # A kept logical with a wrong name, then a call that visits nothing.
        if not ctx.doc.lst:
            ctx.doc.Replace('x = 1\n', 'replace_small')
            ctx.WholePass('planted')
        ctx.doc.lst[-1].fScopeName = 'planted'
        script = NameScript(Rows(ctx.doc.lst), [], [], ctx.doc.text, 'FindChanges([], [])')
        ctx.Call('FindChanges[edit]', 'finder.FindChanges([], [])', ctx.finder.FindChanges, [], [])
        ctx.CheckNames('a planted name', script)
    elif ctx.plant == 'leak':
        _kPlanted.append([object() for _ in range(5)])


_kPlanted = []
