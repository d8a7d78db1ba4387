"""The small published functions: logical tests, the set helper, time, bits, kinds."""

import math
import struct
import sys
import time
import unittest

import pysource.symbolinfo as symbolinfo
from pysource._fastaccess import LogicalLineType
from pysource.scopebodycache import (
    DoubleValueForPyIntBits, DoubleValueForULongLongBits, GetInfoBytesKind, GetLocalScopeDefined,
    GetNowTime, IsDefKind, IsScopeStartLogical, IsWhitespaceLogical, LogicalCheck, OutOfTime,
    PySet_InplaceOr, RaiseIfNotLogical, SetLogicalLocalScopeDefined, ULongLongValueForDoubleBits)

from support import (CapturedStderr, Logical, OtherText, Outcome, Text, kBlankKind, kClassKind, kCommentKind,
                     kDefKind, kOtherTextName)


SubLogical = type('SubLogical', (LogicalLineType,), {})
MySet = type('MySet', (set,), {})


def Bits(f):
    return struct.unpack('<Q', struct.pack('<d', f))[0]


class LogicalTest(unittest.TestCase):

    def testOnlyTheExactTypeIsALogical(self):
        sub = SubLogical(['def', 'f'], 1, 0, kDefKind)
        self.assertIs(LogicalCheck(Logical(['x'])), True)
        self.assertIs(RaiseIfNotLogical(Logical(['x'])), False)
        for obj in [None, 1, 'def f', ['def', 'f'], object(), sub]:
            self.assertIs(LogicalCheck(obj), False)
            for func, extra in [(RaiseIfNotLogical, ()), (IsWhitespaceLogical, ()),
                                (IsScopeStartLogical, ()), (GetLocalScopeDefined, ()),
                                (SetLogicalLocalScopeDefined, ('n',))]:
                self.assertEqual(Outcome(func, obj, *extra),
                                 (TypeError, 'Argument must be a logical'), (func, obj))
        self.assertIsNone(sub.fLocalScopeName)

    def testKindTests(self):
        for kind in range(256):
            l = Logical(['x'], kind=kind)
            self.assertIs(IsWhitespaceLogical(l), kind in (kCommentKind, kBlankKind), kind)
            self.assertIs(IsScopeStartLogical(l), kind in (kClassKind, kDefKind), kind)

    def testNameDefinedByTheTokens(self):
        d, c = kDefKind, kClassKind
        for tokens, kind, expected in [
                (['def', 'f', '(', ')', ':'], d, 'f'), (['async', 'def', 'g', '('], d, 'g'),
                (['\\', 'def', '\\\n', 'h', ':'], d, 'h'), (['define', 'x'], d, 'define'),
                (['async', 'async', 'def', 'k'], d, 'k'), (['def'], d, None),
                (['async', 'def', '\\'], d, None), ([], d, None),
                (['class', 'A', '(', 'B', ')'], c, 'A'), (['\\x', 'class', 'B'], c, 'B'),
                (['async', 'class', 'C'], c, 'async'),  # "async" is skipped before a def only
                (['classy'], c, 'classy'), (['class', 'def', 'D'], c, 'def'),
                (['\\', 'class'], c, None),
                # Keywords compare up to the first NUL.
                (['def\0x', 'f'], d, 'f'), (['class\0', 'A'], c, 'A'), (['de\0f', 'f'], d, 'de\0f'),
                (['def', 'f'], 0, None), (['class', 'A'], kCommentKind, None)]:
            l = Logical(tokens, kind=kind)
            self.assertEqual(GetLocalScopeDefined(l), expected, (tokens, kind))
            if expected is not None:
                self.assertIs(GetLocalScopeDefined(l), l.fTokens[tokens.index(expected)])

    def testStoredNameWins(self):
        for kind in [kDefKind, 0]:
            l, name = Logical(['def', 'f'], kind=kind), 'g#3'
            self.assertIsNone(SetLogicalLocalScopeDefined(l, name))
            self.assertIs(GetLocalScopeDefined(l), name)
        # None clears it; the tokens count again. A name of another type is refused when read.
        SetLogicalLocalScopeDefined(l, None)
        self.assertEqual((l.fLocalScopeName, GetLocalScopeDefined(Logical(['def', 'f'], kind=kDefKind))), (None, 'f'))
        for value, type_name in [(5, 'int'), (OtherText('f'), kOtherTextName)]:
            SetLogicalLocalScopeDefined(l, value)
            self.assertEqual(Outcome(GetLocalScopeDefined, l), (TypeError, Text('Expected bytes, got %s', type_name)))


class SmallFunctionsTest(unittest.TestCase):

    def testSetInplaceOr(self):
        s = set([1, 2])
        for to_add, added in [(set([2, 3]), True), (frozenset([1, 3]), False), (MySet([4]), True), (s, False)]:
            self.assertIs(PySet_InplaceOr(s, to_add), added, to_add)
        self.assertEqual(s, set([1, 2, 3, 4]))
        # set |= x falls back to x.__ror__, whose result must be a set; it is measured, not stored.
        other = lambda result: type('Other', (object,), {'__ror__': lambda self, o: result})()  # noqa: E731
        self.assertEqual([PySet_InplaceOr(s, other(set([5]))), PySet_InplaceOr(s, other(set('abcd')))], [True, False])
        self.assertEqual(s, set([1, 2, 3, 4]))
        wrong = "Argument 'set_obj' has incorrect type (expected set, got %s)"
        for set_obj, to_add, expected in [
                (None, set([1]), (TypeError, "object of type 'NoneType' has no len()")),
                (frozenset(), set([1]), (TypeError, wrong % 'frozenset')), (MySet(), s, (TypeError, wrong % 'MySet')),
                (s, other(MySet([1])), (TypeError, 'Expected set, got MySet'))]:
            self.assertEqual(Outcome(PySet_InplaceOr, set_obj, to_add), expected)
        self.assertRaises(TypeError, PySet_InplaceOr, s, [1])  # the operator's own error

    def testNowAndOutOfTime(self):
        before, now, after = time.time(), GetNowTime(), time.time()
        self.assertIsInstance(now, float)
        self.assertTrue(before - 0.01 <= now <= after + 0.01, (before, now, after))
        self.assertLessEqual(now, GetNowTime())
        self.assertIs(OutOfTime(GetNowTime()), True)  # a time already reached counts
        for end, out in [(0, True), (time.time() - 1.0, True), (time.time() + 60.0, False)]:
            self.assertIs(OutOfTime(end), out, end)
        self.assertRaises(TypeError, OutOfTime, None)

    def testBits(self):
        for f in [0.0, -0.0, -2.5, 5e-324, float('-inf'), math.pi, 1]:
            bits = ULongLongValueForDoubleBits(f)
            self.assertEqual(bits, Bits(f), f)
            self.assertEqual(Bits(DoubleValueForULongLongBits(bits)), Bits(f), f)
            signed = struct.unpack('<q', struct.pack('<d', f))[0]
            self.assertEqual(Bits(DoubleValueForPyIntBits(signed)), Bits(f), f)
        for n in [1 << 63, 2 ** 64 - 1, 0x7ff8000000000001]:
            self.assertEqual(ULongLongValueForDoubleBits(DoubleValueForULongLongBits(n)), n, hex(n))
        self.assertEqual(DoubleValueForPyIntBits(0x3ff0000000000000), 1.0)
        # Signed bits are sign-extended.
        self.assertTrue(math.isnan(DoubleValueForPyIntBits(-1)))
        self.assertEqual(ULongLongValueForDoubleBits(DoubleValueForPyIntBits(-1)), 2 ** 64 - 1)
        self.assertEqual(Bits(DoubleValueForPyIntBits(-2)), 2 ** 64 - 2)
        for func, arg, exc in [
                (ULongLongValueForDoubleBits, '1.0', TypeError), (DoubleValueForULongLongBits, -1, OverflowError),
                (DoubleValueForULongLongBits, 2 ** 64, OverflowError), (DoubleValueForPyIntBits, 2 ** 63, OverflowError)]:
            self.assertRaises(exc, func, arg)

    def testDefKinds(self):
        kinds = [symbolinfo.kFunctionKind, symbolinfo.kMethodKind, symbolinfo.kUnboundMethodKind]
        self.assertNotIn(symbolinfo.kClassKind, kinds)
        for kind in range(-128, 128):
            self.assertIs(IsDefKind(kind), kind in kinds, kind)
        for kind in [128, -129]:
            self.assertEqual(Outcome(IsDefKind, kind), (OverflowError, 'value too large to convert to char'))
        self.assertRaises(TypeError, IsDefKind, 'F')

    def testInfoBytesKind(self):
        plain = symbolinfo.kPlainEquivKind
        wrong = "Argument 'ibytes' has incorrect type (expected str, got %s)"
        for ibytes, expected in [
                ('x', plain), (':', plain), ('x:y', plain), (':Fname', ord('F')), (':\xff', -1),
                (':\0', 0), (OtherText(':x'), (TypeError, wrong % kOtherTextName))]:
            self.assertEqual(Outcome(GetInfoBytesKind, ibytes), expected, repr(ibytes))
        with CapturedStderr() as err:
            self.assertEqual(GetInfoBytesKind(None), 0)
        self.assertIn('pysource.symbolinfo.GetInfoBytesKind', err.getvalue())
        self.assertIn('TypeError', err.getvalue())

    @unittest.skipUnless(hasattr(sys, 'unraisablehook'), 'the hook is 3.8 on')
    def testReportReachesTheUnraisableHook(self):
        seen = []
        saved, sys.unraisablehook = sys.unraisablehook, seen.append
        try:
            with CapturedStderr() as err:
                self.assertEqual(GetInfoBytesKind(None), 0)
        finally:
            sys.unraisablehook = saved
        self.assertEqual([(u.exc_type, u.object) for u in seen],
                         [(TypeError, 'pysource.symbolinfo.GetInfoBytesKind')])
        # The hook reports it; nothing is printed besides.
        self.assertEqual(err.getvalue(), '')
        with CapturedStderr() as err:
            self.assertEqual(GetInfoBytesKind(None), 0)
        # The default hook's form, once.
        self.assertEqual(err.getvalue().count('TypeError'), 1, err.getvalue())
        self.assertTrue(err.getvalue().startswith(
            "Exception ignored in: 'pysource.symbolinfo.GetInfoBytesKind'\nTraceback"), err.getvalue())


if __name__ == '__main__':
    unittest.main()
