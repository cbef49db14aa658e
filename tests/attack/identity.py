"""As root with three users: what one of them owns, each operation on it, by another of them. All are
refused, and the same by the owner is not. The things are

  files and folders by location, link and hard link, and by what is swapped while it is opened
  searches by their ids, guessed and traversing; records, links and folders planted to lead there
  what is stored, by the system's own calls; processes, by signal, ptrace and /proc
  sessions, passwords, names in parameters, the terminal's --user, clean-all
"""

import os
import shutil
import time

from attack import Outcome
from house import become_subreaper
from identity_cells import (link_cells, record_cells, road_cells, search_cells, signal_cells,
                            stored_cells)
from identity_doors import clean_all_cells, early_cells, naming_cells, race_cells, session_cells
from identity_processes import process_cells
from identity_world import USERS, World

PROMISE = "Nobody gets at what is another user's"
ATTACK = "each thing, each operation, by the other users, each beside the owner's own"

LEAST_CELLS = 200
ROUNDS = 300  # of each race
SHORT_ROUNDS = 40
TABLES = {"roads": road_cells, "searches": search_cells, "records": record_cells,
          "signals": signal_cells, "links": link_cells, "stored": stored_cells,
          "processes": process_cells, "sessions": session_cells, "names": naming_cells,
          "clean-all": clean_all_cells, "early": early_cells}


class Campaign:
    def __init__(self, world, outcome, options):
        self.world = world
        self.outcome = outcome
        self.options = options
        self.controls = {}

    def chosen(self, name):
        return self.options.only in name

    def cell(self, table, cell, left_out):
        name = f"{table}: {cell.thing}, {cell.operation}, {cell.owner} by {cell.other}"
        if left_out or not self.chosen(name):
            return
        repeat = f"scripts/attack identity --only '{name}'"
        try:
            if cell.attempt():
                self.outcome.breaks(f"{name}: allowed", repeat)
            if cell.control_name not in self.controls:
                self.controls[cell.control_name] = cell.control()
                if not self.controls[cell.control_name]:
                    self.outcome.breaks(f"{name}: refused to the owner too", repeat)
        except Exception as error:
            self.outcome.breaks(f"{name}: {error!r}", repeat)
        self.outcome.count("cells")

    def races(self, owner, other):
        rounds = SHORT_ROUNDS if self.options.short else ROUNDS
        for thing, operation, attempt, mixed in race_cells(self.world, owner, other, rounds):
            name = f"races: {thing}, {operation}, {owner} by {other}"
            if not self.chosen(name):
                continue
            seen = attempt()
            repeat = f"scripts/attack identity --only '{name}'"
            if {"got", "changed"} & set(seen):
                self.outcome.breaks(f"{name}: another's was reached", repeat)
            if mixed and len(set(seen)) < 2 and not self.options.short:
                self.outcome.breaks(f"{name}: never in time: {set(seen)}", repeat)
            self.outcome.count("cells")
            self.outcome.count("rounds of races", len(seen))

    def over(self, owner, others):
        for table, cells in TABLES.items():
            begin, counted = time.monotonic(), self.outcome.counts.get("cells", 0)
            for place, other in enumerate(others):
                # The short form lets the others take turns.
                for number, cell in enumerate(cells(self.world, owner, other)):
                    self.cell(table, cell, self.options.short and number % len(others) != place)
                self.world.rest()
                self.world.put_back()
            counted = self.outcome.counts.get("cells", 0) - counted
            if counted:
                print(f"{owner}'s {table}: {counted} cells in {time.monotonic() - begin:.1f} s",
                      flush=True)
        for other in others:
            self.races(owner, other)


def options(parser):
    parser.add_argument("--only", default="", metavar="TEXT",
                        help="the cells whose names hold it, as in 'clean, daemon by bin'")


def run(options, bin_dir, top):
    outcome = Outcome()
    if os.geteuid() != 0 or not shutil.which("setfacl"):
        outcome.skip("three users: only root can become them; and setfacl is needed")
        return outcome
    become_subreaper()
    world = World(bin_dir)
    try:
        world.keep()
        campaign = Campaign(world, outcome, options)
        for owner in USERS[:1] if options.short else USERS:
            campaign.over(owner, [user for user in USERS if user != owner])
    finally:
        world.close()
    if not options.only and outcome.counts.get("cells", 0) < LEAST_CELLS:
        outcome.breaks(f"only {outcome.counts.get('cells', 0)} cells", "scripts/attack identity")
    return outcome
