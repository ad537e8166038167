"""Used by the scripts that compare lists of names."""


def differences(what, actual, expected):
    """Returns a line for each item that is missing from the actual list, appears there twice or is not expected."""
    actual = list(actual)
    twice = {item for item in actual if actual.count(item) > 1}
    missing, wrong = set(expected) - set(actual), set(actual) - set(expected)
    kinds = (("is missing", missing), ("appears twice", twice), ("is not expected", wrong))
    return [f"{what}: {item} {fault}" for fault, items in kinds for item in sorted(items)]
