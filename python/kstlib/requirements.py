"""What is missing, as a value: a tree that is copied from the library's and outlives the call."""

from __future__ import annotations

import sys
from dataclasses import dataclass, field
from typing import Iterator, Mapping

from . import _library
from .words import (
    ANY_PURPOSE,
    NO_AGE_LIMIT,
    RequirementProperty,
    RequirementState,
    RequirementType,
    requirement_state_text,
    requirement_type_text,
)

_PROPERTIES: Mapping[int, tuple[RequirementProperty, ...]] = {
    RequirementType.PASSCODE_VALIDATED: (RequirementProperty.AGE_LIMIT,),
    RequirementType.PASSPHRASE_ENTERED: (RequirementProperty.PURPOSE,),
    RequirementType.BIOMETRY_MATCHED: (
        RequirementProperty.AGE_LIMIT,
        RequirementProperty.PROPERTY_300,
        RequirementProperty.PROPERTY_301,
        RequirementProperty.PROPERTY_302,
    ),
    RequirementType.K_OF_N: (RequirementProperty.K,),
    RequirementType.USER_OUTPUT_DISPLAYED: (RequirementProperty.PROPERTY_400,),
}


@dataclass(frozen=True)
class Requirement:
    """One node: a leaf, which one kind of credential meets, or a composite of its children. str() gives the tree
    in words, a line for each node."""

    type: int
    state: int
    priority: int
    properties: Mapping[int, bytes] = field(default_factory=dict, hash=False)
    children: tuple[Requirement, ...] = ()

    @property
    def purpose(self) -> int | None:
        """The purpose of the passphrase that is asked for."""
        return self._number(RequirementProperty.PURPOSE)

    @property
    def age_limit(self) -> int | None:
        """How many seconds ago the credential was added at most; NO_AGE_LIMIT for no limit."""
        return self._number(RequirementProperty.AGE_LIMIT)

    @property
    def k(self) -> int | None:
        """How many of the children it takes, where that is neither all nor one."""
        return self._number(RequirementProperty.K)

    @property
    def text(self) -> str:
        """This node in words."""
        text = requirement_type_text(self.type) if self.k is None else f"{self.k} of"
        if self.type not in list[int](RequirementType):
            text += f": {self.type}"
        if self.purpose is not None:
            text += " for any purpose" if self.purpose == ANY_PURPOSE else f" for purpose {self.purpose}"
        if self.age_limit not in (None, NO_AGE_LIMIT):
            text += f" of the last {self.age_limit} seconds"
        if self.state == RequirementState.TOO_OLD:
            text += f", {requirement_state_text(self.state)}"
        elif self.state != RequirementState.MISSING:
            text += f", state {self.state}"
        return text

    def walk(self) -> Iterator[tuple[int, Requirement]]:
        """Each node with its depth, from 0, and before its children."""
        waiting = [(0, self)]
        while waiting:
            depth, node = waiting.pop()
            yield depth, node
            waiting.extend((depth + 1, child) for child in reversed(node.children))

    def leaves(self) -> Iterator[Requirement]:
        """The nodes without children, in order."""
        return (node for _, node in self.walk() if not node.children)

    def __str__(self) -> str:
        return "\n".join("  " * depth + node.text for depth, node in self.walk())

    def _number(self, number: int) -> int | None:
        data = self.properties.get(number)
        return None if data is None else int.from_bytes(data, sys.byteorder)


@dataclass(frozen=True)
class Answer:
    """The answer to a question: true when the policy is satisfied, and otherwise with what is missing."""

    satisfied: bool
    missing: Requirement | None = None

    def __bool__(self) -> bool:
        return self.satisfied


def copied_tree(root: int) -> Requirement:
    """A tree of the library's as a value. It may be deeper than functions can call themselves."""
    nodes, families = [root], []
    for node in nodes:
        first = len(nodes)
        nodes.extend(_children_of(node))
        families.append(range(first, len(nodes)))
    copies: list[Requirement] = []
    for node, family in zip(reversed(nodes), reversed(families)):
        children = tuple(copies[len(nodes) - 1 - place] for place in family)
        copies.append(_copied_node(node, children))
    return copies[-1]


def _children_of(node: int) -> list[int]:
    block = _library.RequirementBlock
    return _library.collect("KSTRequirementGetSubrequirements", node, block=block, take=int)


def _copied_node(node: int, children: tuple[Requirement, ...]) -> Requirement:
    kind, state, priority = (
        _library.call(f"KSTRequirementGet{what}", node) for what in ("Type", "State", "Priority")
    )
    properties = {
        int(number): bytes(_library.copy_of_bytes("KSTRequirementGetProperty", node, number))
        for number in _PROPERTIES.get(kind, ())
    }
    return Requirement(kind, state, priority, properties, children)
