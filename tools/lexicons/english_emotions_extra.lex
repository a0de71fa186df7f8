# English emotion words, written for this project (mkbdb's lexicon format: the emotion
# label is the base form of a record of class "unkonwn"). They replace VADER's label of
# the same word: apologies, which VADER rates too mildly to be labelled ("sorry": -0.3),
# the words of success and welcome, which are labelled "very positive" so that they hold
# against the problem that they overcome ("we succeeded in fixing the problem"), and
# fear and failure words that VADER leaves out.
sorry	unkonwn=negative
apologize	unkonwn=negative
apologizes	unkonwn=negative
apologized	unkonwn=negative
apologise	unkonwn=negative
apologies	unkonwn=negative
apology	unkonwn=negative
afraid	unkonwn=negative
scared	unkonwn=negative
broken	unkonwn=negative
crashed	unkonwn=negative
crashes	unkonwn=negative
unfortunately	unkonwn=negative
succeed	unkonwn=very positive
succeeds	unkonwn=very positive
succeeded	unkonwn=very positive
success	unkonwn=very positive
successful	unkonwn=very positive
successfully	unkonwn=very positive
congratulations	unkonwn=very positive
congrats	unkonwn=very positive
bravo	unkonwn=very positive
welcome	unkonwn=positive
thank	unkonwn=positive
thanks	unkonwn=positive
thanked	unkonwn=positive
