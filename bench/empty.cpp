// Does nothing: what starting any program with these libraries costs.
int main() {}
