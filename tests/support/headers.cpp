// Owns the headers that are compiled once for all test programs; there is nothing else in it.
int main() {
  return 0;
}
