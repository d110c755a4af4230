/* A library without an adaptor class. */
int tallydTestAnswer(void);

int tallydTestAnswer(void) { return 42; }
