from scripts import load

coverage = load("coverage")

TABLE = """
## What no test runs

| file | line | outcomes | why |
| --- | --- | --- | --- |
| `client/A.cpp` | `if (!made) return false;` | 1 | Nothing fails there. |
| `client/B.cpp` | `return a \\| b \\|\\| c;` | 2 | As in A.cpp. |

## Another

| `client/C.cpp` | `not here` | 1 | why |
"""
EXPLAINED = {("client/A.cpp", "if (!made) return false;"): 1, ("client/B.cpp", "return a | b || c;"): 2}
MISSED = [("client/A.cpp", 7, "if (!made) return false;", "never true"),
          ("client/B.cpp", 8, "return a | b || c;", "never true"),
          ("client/B.cpp", 8, "return a | b || c;", "never false")]


def test_reasons_are_read_by_the_text_of_their_lines():
    assert coverage.reasons(TABLE) == EXPLAINED


def test_what_has_a_reason_is_right_wherever_it_stands():
    assert list(coverage.wrong_reasons(MISSED, EXPLAINED)) == []
    assert list(coverage.wrong_reasons([(name, line + 100, *rest) for name, line, *rest in MISSED], EXPLAINED)) == []


def test_another_line_of_the_same_function_needs_its_own():
    other = ("client/A.cpp", 9, "if (!written) return false;", "never true")
    assert list(coverage.wrong_reasons([*MISSED, other], EXPLAINED)) == [
        "client/A.cpp: if (!written) return false;: 1 outcomes do not run, 0 have a reason"]


def test_the_same_line_once_more_needs_its_own():
    again = ("client/A.cpp", 90, "if (!made) return false;", "never true")
    assert list(coverage.wrong_reasons([*MISSED, again], EXPLAINED)) == [
        "client/A.cpp: if (!made) return false;: 2 outcomes do not run, 1 have a reason"]


def test_a_reason_that_is_not_needed_is_told():
    assert list(coverage.wrong_reasons(MISSED[1:], EXPLAINED)) == [
        "client/A.cpp: if (!made) return false;: 0 outcomes do not run, 1 have a reason"]
