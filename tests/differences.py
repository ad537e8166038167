"""What the checks of names share."""


def differences(what, actual, expected):
    """Lines that tell what one side lacks, and what the first has too much or twice."""
    actual = list(actual)
    twice = {item for item in actual if actual.count(item) > 1}
    missing, wrong = set(expected) - set(actual), set(actual) - set(expected)
    kinds = (("is missing", missing), ("stands twice", twice), ("is not so", wrong))
    return [f"{what}: {item} {fault}" for fault, items in kinds for item in sorted(items)]
