// Compiles the headers that most tests include; it holds nothing itself.
