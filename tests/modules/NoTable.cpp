// A shared object like any other.

int answerOf(int question);
int answerOf(int question) { return question + 1; }
