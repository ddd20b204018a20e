package halvenor.test;

/** A class that declares only one of the two callbacks. */
public class NoSendCallback {
    public void onReceivedTestData(int value) {}
}
