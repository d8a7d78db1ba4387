"""The small published functions: logical tests, the set helper, time, bits, kinds."""

import math
import struct
import time
import unittest

import pysource.symbolinfo as symbolinfo
from pysource._fastaccess import LogicalLineType
from pysource.scopebodycache import (
    DoubleValueForPyIntBits, DoubleValueForULongLongBits, GetInfoBytesKind, GetLocalScopeDefined,
    GetNowTime, IsDefKind, IsScopeStartLogical, IsWhitespaceLogical, LogicalCheck, OutOfTime,
    PySet_InplaceOr, RaiseIfNotLogical, SetLogicalLocalScopeDefined, ULongLongValueForDoubleBits)

from support import CapturedStderr, Logical, kBlankKind, kClassKind, kCommentKind, kDefKind


class SubLogical(LogicalLineType):
    pass


class MySet(set):
    pass


def Bits(f):
    return struct.unpack('<Q', struct.pack('<d', f))[0]


kNotLogicals = [None, 1, 'def f', ['def', 'f'], object(), SubLogical(['def', 'f'], 1, 0, 2)]


class LogicalTestsTest(unittest.TestCase):

    def testOnlyTheExactTypeIsALogical(self):
        self.assertIs(LogicalCheck(Logical(['x'])), True)
        for obj in kNotLogicals:
            self.assertIs(LogicalCheck(obj), False)
            with self.assertRaises(TypeError) as cm:
                RaiseIfNotLogical(obj)
            self.assertEqual(str(cm.exception), 'Argument must be a logical')
        self.assertIs(RaiseIfNotLogical(Logical(['x'])), False)

    def testKindTests(self):
        for kind in range(0, 256, 1):
            l = Logical(['x'], kind=kind)
            self.assertIs(IsWhitespaceLogical(l), kind in (kCommentKind, kBlankKind), kind)
            self.assertIs(IsScopeStartLogical(l), kind in (kClassKind, kDefKind), kind)

    def testAccessorsRefuseNonLogicals(self):
        for func, extra in [(IsWhitespaceLogical, ()), (IsScopeStartLogical, ()),
                            (GetLocalScopeDefined, ()), (SetLogicalLocalScopeDefined, ('n',))]:
            for obj in kNotLogicals:
                with self.assertRaises(TypeError) as cm:
                    func(obj, *extra)
                self.assertEqual(str(cm.exception), 'Argument must be a logical')

    def testSetOnANonLogicalWritesNothing(self):
        sub = SubLogical(['def', 'f'], 1, 0, kDefKind)
        self.assertRaises(TypeError, SetLogicalLocalScopeDefined, sub, 'g#0')
        self.assertIsNone(sub.fLocalScopeName)


class LocalScopeDefinedTest(unittest.TestCase):

    def Defined(self, tokens, kind):
        return GetLocalScopeDefined(Logical(tokens, kind=kind))

    def testDefNames(self):
        l = Logical(['def', 'f', '(', ')', ':'], kind=kDefKind)
        self.assertIs(GetLocalScopeDefined(l), l.fTokens[1])
        self.assertEqual(self.Defined(['async', 'def', 'g', '(', ')', ':'], kDefKind), 'g')
        self.assertEqual(self.Defined(['\\', 'def', '\\\n', 'h', ':'], kDefKind), 'h')
        self.assertEqual(self.Defined(['define', 'x'], kDefKind), 'define')
        self.assertEqual(self.Defined(['async', 'async', 'def', 'k'], kDefKind), 'k')
        self.assertIsNone(self.Defined(['def'], kDefKind))
        self.assertIsNone(self.Defined(['async', 'def', '\\'], kDefKind))
        self.assertIsNone(self.Defined([], kDefKind))

    def testClassNames(self):
        self.assertEqual(self.Defined(['class', 'A', '(', 'B', ')', ':'], kClassKind), 'A')
        self.assertEqual(self.Defined(['\\x', 'class', 'B'], kClassKind), 'B')
        # "async" is only skipped before a def.
        self.assertEqual(self.Defined(['async', 'class', 'C'], kClassKind), 'async')
        self.assertEqual(self.Defined(['classy'], kClassKind), 'classy')
        self.assertEqual(self.Defined(['class', 'def', 'D'], kClassKind), 'def')
        self.assertIsNone(self.Defined(['\\', 'class'], kClassKind))

    def testTokensCompareUpToTheFirstNul(self):
        self.assertEqual(self.Defined(['def\0x', 'f'], kDefKind), 'f')
        self.assertEqual(self.Defined(['class\0', 'A'], kClassKind), 'A')
        self.assertEqual(self.Defined(['de\0f', 'f'], kDefKind), 'de\0f')

    def testOtherKindsDefineNothing(self):
        for kind in [0, 3, kCommentKind, kBlankKind, 255]:
            self.assertIsNone(self.Defined(['def', 'f'], kind))
            self.assertIsNone(self.Defined(['class', 'A'], kind))

    def testStoredNameWins(self):
        for kind in [kDefKind, kClassKind, 0, kCommentKind]:
            l = Logical(['def', 'f'], kind=kind)
            name = 'g#3'
            self.assertIsNone(SetLogicalLocalScopeDefined(l, name))
            self.assertIs(l.fLocalScopeName, name)
            self.assertIs(GetLocalScopeDefined(l), name)
        # None clears it; the tokens count again.
        l = Logical(['def', 'f'], kind=kDefKind)
        SetLogicalLocalScopeDefined(l, 'g#3')
        SetLogicalLocalScopeDefined(l, None)
        self.assertIsNone(l.fLocalScopeName)
        self.assertEqual(GetLocalScopeDefined(l), 'f')

    def testStoredNameMustBeAStr(self):
        for value, type_name in [(5, 'int'), (u'f', 'unicode'), (bytearray('f'), 'bytearray')]:
            l = Logical(['def', 'f'], kind=kDefKind)
            SetLogicalLocalScopeDefined(l, value)
            self.assertIs(l.fLocalScopeName, value)
            with self.assertRaises(TypeError) as cm:
                GetLocalScopeDefined(l)
            self.assertEqual(str(cm.exception), 'Expected bytes, got %s' % type_name)


class SetInplaceOrTest(unittest.TestCase):

    def testReportsWhetherAnythingWasAdded(self):
        s = set([1, 2])
        self.assertIs(PySet_InplaceOr(s, set([2, 3])), True)
        self.assertEqual(s, set([1, 2, 3]))
        self.assertIs(PySet_InplaceOr(s, frozenset([1, 3])), False)
        self.assertIs(PySet_InplaceOr(s, set()), False)
        self.assertIs(PySet_InplaceOr(s, MySet([4])), True)
        self.assertEqual(s, set([1, 2, 3, 4]))
        empty = set()
        self.assertIs(PySet_InplaceOr(empty, empty), False)

    def testSetObjectTypes(self):
        with self.assertRaises(TypeError) as cm:
            PySet_InplaceOr(None, set([1]))
        self.assertEqual(str(cm.exception), "object of type 'NoneType' has no len()")
        for obj, name in [(frozenset(), 'frozenset'), (MySet(), 'MySet'), ([], 'list')]:
            with self.assertRaises(TypeError) as cm:
                PySet_InplaceOr(obj, set([1]))
            self.assertEqual(
                str(cm.exception),
                "Argument 'set_obj' has incorrect type (expected set, got %s)" % name)

    def testOperatorErrorsPropagate(self):
        for to_add in [[1], None, (1,), 'ab']:
            try:
                probe = set()
                probe |= to_add
            except TypeError as e:
                expected = str(e)
            s = set([9])
            with self.assertRaises(TypeError) as cm:
                PySet_InplaceOr(s, to_add)
            self.assertEqual(str(cm.exception), expected)
            self.assertEqual(s, set([9]))

    def testOperatorResultMustBeASet(self):
        # set |= x falls back to x.__ror__, whose result is then checked.
        class Other(object):
            def __init__(self, result):
                self.result = result

            def __ror__(self, other):
                return self.result

        for result, name in [([1], 'list'), (frozenset([1, 2]), 'frozenset'),
                             (MySet([1, 2]), 'MySet')]:
            with self.assertRaises(TypeError) as cm:
                PySet_InplaceOr(set([1]), Other(result))
            self.assertEqual(str(cm.exception), 'Expected set, got %s' % name)
        # A set result is measured against the original length.
        s = set([1])
        self.assertIs(PySet_InplaceOr(s, Other(set([5, 6]))), True)
        self.assertIs(PySet_InplaceOr(s, Other(set([5]))), False)
        self.assertEqual(s, set([1]))


class TimeTest(unittest.TestCase):

    def testNowIsTheWallClock(self):
        before = time.time()
        now = GetNowTime()
        after = time.time()
        self.assertIsInstance(now, float)
        self.assertTrue(before - 0.01 <= now <= after + 0.01, (before, now, after))
        self.assertLessEqual(now, GetNowTime())

    def testOutOfTime(self):
        self.assertIs(OutOfTime(0.0), True)
        self.assertIs(OutOfTime(1e18), False)
        self.assertIs(OutOfTime(time.time() - 1.0), True)
        self.assertIs(OutOfTime(time.time() + 60.0), False)
        # A time already reached counts as out of time.
        self.assertIs(OutOfTime(GetNowTime()), True)
        self.assertIs(OutOfTime(0), True)
        self.assertIs(OutOfTime(float('-inf')), True)
        self.assertIs(OutOfTime(float('inf')), False)
        self.assertRaises(TypeError, OutOfTime, 'soon')
        self.assertRaises(TypeError, OutOfTime, None)


class BitsTest(unittest.TestCase):

    kDoubles = [0.0, -0.0, 1.0, -2.5, 1e308, 5e-324, 2.2250738585072014e-308,
                float('inf'), float('-inf'), math.pi]

    def testDoubleToBits(self):
        for f in self.kDoubles:
            bits = ULongLongValueForDoubleBits(f)
            self.assertIsInstance(bits, (int, long))
            self.assertEqual(bits, Bits(f), f)
        self.assertEqual(ULongLongValueForDoubleBits(1), Bits(1.0))
        self.assertEqual(ULongLongValueForDoubleBits(-0.0), 1 << 63)
        self.assertRaises(TypeError, ULongLongValueForDoubleBits, '1.0')

    def testBitsToDouble(self):
        for n in [0, 1, 0x3ff0000000000000, 1 << 63, 0x7ff0000000000000, 2 ** 64 - 1,
                  0x7ff8000000000001]:
            f = DoubleValueForULongLongBits(n)
            self.assertIsInstance(f, float)
            self.assertEqual(ULongLongValueForDoubleBits(f), n, hex(n))
        self.assertEqual(DoubleValueForULongLongBits(0x3ff0000000000000), 1.0)
        self.assertRaises(OverflowError, DoubleValueForULongLongBits, -1)
        self.assertRaises(OverflowError, DoubleValueForULongLongBits, 2 ** 64)
        self.assertRaises(TypeError, DoubleValueForULongLongBits, 1.0)

    def testRoundTrips(self):
        for f in self.kDoubles:
            back = DoubleValueForULongLongBits(ULongLongValueForDoubleBits(f))
            self.assertEqual(Bits(back), Bits(f))
            back = DoubleValueForPyIntBits(struct.unpack('<q', struct.pack('<d', f))[0])
            self.assertEqual(Bits(back), Bits(f))

    def testSignedBitsAreSignExtended(self):
        nan = DoubleValueForPyIntBits(-1)
        self.assertTrue(math.isnan(nan))
        self.assertEqual(ULongLongValueForDoubleBits(nan), 2 ** 64 - 1)
        smallest = DoubleValueForPyIntBits(-2 ** 63)
        self.assertEqual(smallest, 0.0)
        self.assertEqual(math.copysign(1.0, smallest), -1.0)
        self.assertEqual(DoubleValueForPyIntBits(0x3ff0000000000000), 1.0)
        self.assertEqual(Bits(DoubleValueForPyIntBits(-2)), 2 ** 64 - 2)
        self.assertRaises(OverflowError, DoubleValueForPyIntBits, 2 ** 63)
        self.assertRaises(OverflowError, DoubleValueForPyIntBits, -2 ** 63 - 1)


class SymbolKindsTest(unittest.TestCase):

    def testDefKinds(self):
        kinds = [symbolinfo.kFunctionKind, symbolinfo.kMethodKind, symbolinfo.kUnboundMethodKind]
        for kind in kinds:
            self.assertIsInstance(kind, int)
            self.assertIs(IsDefKind(kind), True)
        for kind in range(-128, 128):
            self.assertIs(IsDefKind(kind), kind in kinds, kind)
        self.assertIs(IsDefKind(symbolinfo.kClassKind), False)

    def testKindOutsideTheCharRange(self):
        for kind in [128, -129, 2 ** 40]:
            with self.assertRaises(OverflowError) as cm:
                IsDefKind(kind)
            self.assertEqual(str(cm.exception), 'value too large to convert to char')
        self.assertRaises(TypeError, IsDefKind, 'F')
        self.assertRaises(TypeError, IsDefKind, None)

    def testInfoBytesKind(self):
        plain = symbolinfo.kPlainEquivKind
        for ibytes in ['', 'x', ':', 'ab', 'x:y', '::'[:1]]:
            self.assertEqual(GetInfoBytesKind(ibytes), plain, repr(ibytes))
        self.assertEqual(GetInfoBytesKind(':x'), ord('x'))
        self.assertEqual(GetInfoBytesKind(':Fname'), ord('F'))
        self.assertEqual(GetInfoBytesKind('::'), ord(':'))
        self.assertEqual(GetInfoBytesKind(':\xff'), -1)
        self.assertEqual(GetInfoBytesKind(':\x80rest'), -128)
        self.assertEqual(GetInfoBytesKind(':\0'), 0)

    def testInfoBytesKindOfNoneIsReported(self):
        with CapturedStderr() as err:
            self.assertEqual(GetInfoBytesKind(None), 0)
        self.assertIn('pysource.symbolinfo.GetInfoBytesKind', err.getvalue())
        self.assertIn('TypeError', err.getvalue())

    def testInfoBytesKindArgumentType(self):
        for ibytes, name in [(5, 'int'), (u':x', 'unicode'), (bytearray(':x'), 'bytearray')]:
            with self.assertRaises(TypeError) as cm:
                GetInfoBytesKind(ibytes)
            self.assertEqual(
                str(cm.exception),
                "Argument 'ibytes' has incorrect type (expected str, got %s)" % name)


if __name__ == '__main__':
    unittest.main()
