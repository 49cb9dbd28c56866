// A program of no tests, for the headers that all test programs share once compiled.
