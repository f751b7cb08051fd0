"""Chooses mutants, tries them, and reports the results."""

import collections
import random
import re
import shutil
import threading
import time
from concurrent.futures import CancelledError, ThreadPoolExecutor
from dataclasses import dataclass

from .mutants import mutants_of

_TEST_FILE = re.compile(r"(Test|_test|Fixture)\.(h|cpp)$")
# The composition root. No unit test links it.
_COMPOSITION_ROOT = "service/main.cpp"

NOT_COMPILED, KILLED, SURVIVED = "not compiled", "killed", "survived"


@dataclass
class Outcome:
    mutant: object
    state: str
    by: str = ""  # what noticed it
    seconds: float = 0.0


def sources_in(root, folders):
    """The sources of folders without their tests, as paths from the root."""
    found = []
    for folder in folders:
        for path in sorted((root / folder).rglob("*")):
            name = str(path.relative_to(root))
            if path.suffix in {".cpp", ".h"} and not _TEST_FILE.search(name) \
                    and "/testdata/" not in name and name != _COMPOSITION_ROOT:
                found.append(name)
    return found


class Choice:
    """The mutants of a file: one of each place in random order, then the next one of each place."""

    def __init__(self, file, places, generator):
        self.file = file
        self.places = len(places)
        rounds = collections.defaultdict(list)
        for place in places:
            for turn, mutant in enumerate(generator.sample(place, len(place))):
                rounds[turn].append(mutant)
        self._order = []
        for turn in sorted(rounds):
            self._order += generator.sample(rounds[turn], len(rounds[turn]))

    def next(self):
        return self._order.pop(0) if self._order else None


def shares(choices, count):
    """How many of `count` mutants each file gets: in proportion to its places, the remainder to the
    largest fractions."""
    total = sum(choice.places for choice in choices)
    exact = {choice.file: count * choice.places / total for choice in choices}
    given = {file: int(share) for file, share in exact.items()}
    by_fraction = sorted(exact, key=lambda file: (given[file] - exact[file], file))
    for file in by_fraction[:count - sum(given.values())]:
        given[file] += 1
    return given


class Campaign:
    def __init__(self, tree, jobs, say):
        self._tree = tree
        self._jobs = jobs
        self._say = say
        self._lock = threading.Lock()
        self._ending = threading.Event()
        self._number = 0
        self.outcomes = []

    def run_chosen(self, files, count, seed):
        """Tries that many mutants that compile, spread over the files."""
        generator = random.Random(seed)
        choices = [Choice(file, mutants_of(file, self._tree.text(file)), generator) for file in files]
        choices = [choice for choice in choices if choice.places]
        given = shares(choices, count)

        def one_of(choice):
            # A mutant that does not compile is replaced by the next one of its file.
            while (mutant := choice.next()) is not None:
                if self._record(mutant).state != NOT_COMPILED:
                    return

        # Each file is one job at a time. If jobs shared a file, the order in which they end would
        # decide which mutants are chosen, and a seed would not always give the same ones.
        def all_of(choice):
            for _ in range(given[choice.file]):
                one_of(choice)

        self._in_parallel(all_of, sorted(choices, key=lambda choice: -given[choice.file]))

    def run_all(self, mutants):
        self._in_parallel(self._record, mutants)

    def _in_parallel(self, work, items):
        with ThreadPoolExecutor(self._jobs) as pool:
            try:
                for done in [pool.submit(work, item) for item in items]:
                    done.result()
            except BaseException:
                self._ending.set()
                pool.shutdown(cancel_futures=True)
                raise

    def _record(self, mutant):
        if self._ending.is_set():
            raise CancelledError
        with self._lock:
            self._number += 1
            directory = self._tree.scratch(self._number)
        begin = time.monotonic()
        try:
            outcome = self._try(mutant, directory)
        finally:
            shutil.rmtree(directory, ignore_errors=True)
        outcome.seconds = time.monotonic() - begin
        with self._lock:
            self.outcomes.append(outcome)
            self._say(f"{outcome.state:12} {outcome.seconds:5.1f} s  {mutant}"
                      + (f"  [{outcome.by}]" if outcome.by else ""))
        return outcome

    def _try(self, mutant, directory):
        changed = directory / mutant.file
        changed.parent.mkdir(parents=True)
        changed.write_text(mutant.apply(self._tree.text(mutant.file)))
        objects, linked = {}, []
        for program in self._tree.programs_for(mutant.folder):
            wanted = self._tree.objects_with(mutant.file, program)
            for one in wanted:
                if one not in objects:
                    objects[one] = self._tree.compile(one, mutant.file, directory)
                if objects[one] is None:
                    return Outcome(mutant, NOT_COMPILED)
            if not wanted:
                continue
            path = directory / program.name
            if not program.link({one: objects[one] for one in wanted}, path):
                return Outcome(mutant, NOT_COMPILED)
            how, test = program.fails(path)
            if how is not None:
                return Outcome(mutant, KILLED, f"{how} {test or program.name}")
            linked.append((program, path))
        for program, path in linked:
            if program.has_slow_tests:
                how, test = program.fails(path, slow=True)
                if how is not None:
                    return Outcome(mutant, KILLED, f"{how} {test or program.name}")
        return Outcome(mutant, SURVIVED)


def report(outcomes, folders, say):
    """Prints the survivors and a table. Returns the outcomes of the mutants that compiled."""
    compiled = [one for one in outcomes if one.state != NOT_COMPILED]
    survivors = sorted((one for one in compiled if one.state == SURVIVED),
                       key=lambda one: (one.mutant.file, one.mutant.start, one.mutant.kind))
    if survivors:
        say("\nSurvivors:")
        for one in survivors:
            say(f"  {one.mutant}")
    say(f"\n{'folder':12}{'compiled':>9}{'killed':>8}{'survived':>10}{'':>8}{'not compiled':>14}")
    for folder in [*folders, "all"]:
        states = collections.Counter(one.state for one in outcomes
                                     if folder in (one.mutant.folder, "all"))
        total = states[KILLED] + states[SURVIVED]
        share = f"{100 * states[SURVIVED] / total:.1f} %" if total else "-"
        say(f"{folder:12}{total:9}{states[KILLED]:8}{states[SURVIVED]:10}{share:>8}"
            f"{states[NOT_COMPILED]:14}")
    return compiled
