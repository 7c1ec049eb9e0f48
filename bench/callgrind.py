"""Reads what callgrind writes: what each function has cost by itself, and each call with all below it."""

import collections
import re

CALLED = re.compile(r"calls=\d+")
COST = re.compile(r"[+\-*\d]\S*\s+(\d+)$")


class Profile:
    def __init__(self, text):
        self.total = 0
        self.by_object = collections.Counter()
        self.calls = collections.defaultdict(collections.Counter)  # caller -> callee -> cost
        self.names = {}
        self.read(text.splitlines())

    def name(self, kind, text):
        """A name in its short form "(number)", which is explained where it is first used."""
        number, _, rest = text.partition(" ")
        if rest:
            self.names[kind, number] = rest
        return self.names.get((kind, number), text)

    def read(self, lines):
        caller = callee = current = None
        follows_call = False
        for line in lines:
            key, _, value = line.partition("=")
            if key == "ob":
                current = self.name("ob", value)
            elif key == "cob":
                self.name("ob", value)
            elif key == "fn":
                caller = self.name("fn", value)
            elif key == "cfn":
                callee = self.name("fn", value)
            elif CALLED.match(line):
                follows_call = True
            elif match := COST.match(line):
                self.count(int(match.group(1)), current, caller, callee if follows_call else None)
                follows_call = False

    def count(self, cost, binary, caller, callee):
        if callee is not None:
            self.calls[caller][callee] += cost
        else:
            self.by_object[binary] += cost
            self.total += cost

    def inclusive(self, function):
        """All that was spent below the calls of functions of that name."""
        return sum(cost for callees in self.calls.values() for callee, cost in callees.items() if function in callee)


def less(larger, smaller):
    """The one counter without what is in the other."""
    return collections.Counter({key: cost - smaller[key] for key, cost in larger.items()})


def difference(larger, smaller):
    """A profile of what the one run did more than the other."""
    result = Profile("")
    result.total = larger.total - smaller.total
    result.by_object = less(larger.by_object, smaller.by_object)
    for caller, callees in larger.calls.items():
        result.calls[caller] = less(callees, smaller.calls[caller])
    return result
