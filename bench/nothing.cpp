/** The least that a job can be. */
int main() {
    return 0;
}
